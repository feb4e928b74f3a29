#include <iterator>
#include <utility>

#include "common/error.h"
#include "common/json.h"
#include "fileindex/queue/ledger.h"
#include "fileindex/queue/optree.h"

namespace quarry::fileindex {
namespace {

constexpr const char* kSwitches[] = {"document", "audio", "video", "photo"};

}  // namespace

OP::OP(std::shared_ptr<OPNode> op_node, FileIndexOP kind, const std::string& source,
       const Json::Value& payload)
    : node(std::move(op_node)), op(kind), src(source), data(payload) {}

OP::OP(std::shared_ptr<OPNode> op_node, FileIndexOP kind) : node(std::move(op_node)), op(kind) {}

OP::~OP() = default;

void OP::MergeData(const Json::Value& other) {
  bool incoming[std::size(kSwitches)] = {};
  for (std::size_t i = 0; i < std::size(kSwitches); ++i) {
    GetJsonValue(incoming[i], other, kSwitches[i], false);
  }
  if (!isObject(data)) throw Error(kErrorBadParameter, "Not an object" + AppendData(data));
  for (std::size_t i = 0; i < std::size(kSwitches); ++i) {
    Json::Value& value = data[kSwitches[i]];
    value = incoming[i] || (value.isBool() && value.asBool());
  }
}

OPNode::OPNode(std::shared_ptr<OPNode> parent_node, const std::string& node_name)
    : name(node_name), parent(std::move(parent_node)) {}

// A long chain of parents that nobody else holds is let go from below, one by one: each releasing
// the next would need a stack as deep as the path.
OPNode::~OPNode() {
  std::shared_ptr<OPNode> above = std::move(parent);
  while (above && above.use_count() == 1) {
    std::shared_ptr<OPNode> next = std::move(above->parent);
    above = std::move(next);
  }
}

std::shared_ptr<OPNode> OPNode::GetChild(const std::string& child_name) {
  return Ledger::Child(*this, child_name, nullptr);
}

std::string OPNode::GetPath() const {
  std::size_t length = name.size();
  std::vector<const OPNode*> above;
  for (const OPNode* node = parent.get(); node != nullptr; node = node->parent.get()) {
    above.push_back(node);
    length += node->name.size() + 1;
  }
  std::string path;
  path.reserve(length);
  for (auto node = above.rbegin(); node != above.rend(); ++node) {
    path += (*node)->name;
    path += '/';
  }
  return path += name;
}

void OPNode::TraverseOP(std::function<void(std::shared_ptr<OP>)> fn) {
  Ledger::Forget(*this);
  for (std::size_t i = 0; i < ops.size(); ++i) fn(ops[i]);
}

std::ostream& operator<<(std::ostream& stream, const OP& op) {
  stream << '[' << static_cast<int>(op.op) << "] ";
  if (!op.src.empty()) stream << op.src << " -> ";
  if (op.node) stream << op.node->GetPath();
  return stream << ", data=" << toString(op.data);
}

std::ostream& operator<<(std::ostream& stream, const OPNode& node) {
  stream << "Node[" << node.name << "]: \n";
  for (const std::shared_ptr<OP>& op : node.ops) stream << "  " << *op << '\n';
  return stream;
}

}  // namespace quarry::fileindex
