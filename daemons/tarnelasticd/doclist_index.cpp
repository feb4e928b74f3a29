#include "daemons/tarnelasticd/doclist_index.h"

#include "daemons/tarnelasticd/fts_number.h"
#include "daemons/tarnelasticd/segment_reader.h"

namespace quarry::engine {
namespace {

constexpr int kHeightBits = 31;  // behind the number of a leaf
constexpr std::int64_t kIndexMark = std::int64_t{1} << 36;
constexpr std::size_t kNodeBytes = 4050;
// FTS5 takes shorter lists to be read as fast without.
constexpr std::size_t kLeastLeaves = 4;

void Put(std::string* bytes, std::int64_t number) {
  AppendVarint(bytes, static_cast<std::uint64_t>(number));
}

}  // namespace

DoclistIndex::DoclistIndex(Database* db, const std::string& table, std::int64_t segment)
    : insert_(db->Prepare("INSERT INTO " + table + "_data(id,block) VALUES(?1,?2)")),
      segment_(segment) {}

void DoclistIndex::Write(std::size_t height, const Node& node) {
  const std::int64_t id = (segment_ << kLeafBits) + kIndexMark +
                          (static_cast<std::int64_t>(height) << kHeightBits) + node.number;
  insert_.Bind(1, id).BindBlob(2, node.bytes).Run();
}

// Writes the node that is full. The next one begins, and what stands above them has the first.
void DoclistIndex::MoveOn(std::size_t height) {
  nodes_[height].bytes[0] = 1;
  Write(height, nodes_[height]);
  if (nodes_.size() == height + 1) {
    const char* at = nodes_[height].bytes.data() + 1;
    const char* const end = nodes_[height].bytes.data() + nodes_[height].bytes.size();
    TakeVarint(&at, end);
    const auto first_row = static_cast<std::int64_t>(TakeVarint(&at, end));
    Node above{nodes_[height].number, std::string(1, '\0'), first_row};
    Put(&above.bytes, above.number);
    Put(&above.bytes, first_row);
    nodes_.push_back(above);
  }
  nodes_[height].bytes.clear();
  ++nodes_[height].number;
}

void DoclistIndex::AddRow(std::int64_t leaf, std::int64_t row) {
  if (nodes_.empty()) nodes_.push_back({first_node_, "", 0});
  bool is_full = true;
  for (std::size_t height = 0; is_full; ++height) {
    is_full = nodes_[height].bytes.size() >= kNodeBytes;
    if (is_full) MoveOn(height);
    Node& node = nodes_[height];
    if (node.bytes.empty()) {
      node.bytes.push_back(is_full ? '\1' : '\0');
      Put(&node.bytes, height == 0 ? leaf : nodes_[height - 1].number);
      Put(&node.bytes, row);
    } else {
      Put(&node.bytes, row - node.last_row);
    }
    node.last_row = row;
  }
}

void DoclistIndex::AddLeaf(bool has_row) {
  ++leaves_;
  if (!has_row && !nodes_.empty()) nodes_[0].bytes.push_back('\0');
}

bool DoclistIndex::Finish() {
  const bool is_long = !nodes_.empty() && leaves_ >= kLeastLeaves;
  for (std::size_t height = 0; is_long && height < nodes_.size(); ++height) {
    Write(height, nodes_[height]);
  }
  nodes_.clear();
  leaves_ = 0;
  return is_long;
}

}  // namespace quarry::engine
