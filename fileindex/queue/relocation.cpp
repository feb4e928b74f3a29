#include "fileindex/queue/relocation.h"

#include <utility>

namespace quarry::fileindex {

Relocation::Relocation(OPNode& source, OPNode& destination, Pool& pool) : pool_(pool) {
  stops_.push_back({&source, 0, &destination});
  Load(stops_.front());
  Collect(source, destination);
  // The walk may have passed by the destination and forgotten the way to it.
  Ledger::Touch(destination);
}

void Relocation::Collect(OPNode& source, OPNode& destination) {
  std::vector<std::pair<OPNode*, std::size_t>> waiting;
  const auto descend = [&waiting](OPNode& node, std::size_t stop) {
    const std::vector<OPNode*> children = Ledger::TakeMovable(node);
    for (auto child = children.rbegin(); child != children.rend(); ++child) {
      waiting.emplace_back(*child, stop);
    }
  };
  descend(source, 0);
  while (!waiting.empty()) {
    const auto [node, above] = waiting.back();
    waiting.pop_back();
    if (node == &destination) continue;
    stops_.push_back({node, above});
    if (Ledger::HasPending(*node)) Load(stops_.back());
    descend(*node, stops_.size() - 1);
  }
}

void Relocation::Load(Stop& stop) {
  stop.carried = Ledger::TakeWork(*stop.from);
  stop.bundle = Ledger::Take(*stop.from);
  stop.loaded = true;
}

OPNode& Relocation::Target(std::size_t index) {
  std::vector<std::size_t> missing;
  for (std::size_t at = index; stops_[at].to == nullptr; at = stops_[at].above) {
    missing.push_back(at);
  }
  for (auto at = missing.rbegin(); at != missing.rend(); ++at) {
    Stop& stop = stops_[*at];
    stop.to = Ledger::Child(*stops_[stop.above].to, stop.from->name, &pool_).get();
  }
  return *stops_[index].to;
}

std::vector<std::shared_ptr<OP>> Relocation::Deliver(const OP* current,
                                                     std::vector<OPNode*>& unsettled) {
  std::vector<std::shared_ptr<OP>> carriers;
  for (std::size_t i = 0; i < stops_.size(); ++i) {
    if (!stops_[i].loaded) continue;
    OPNode& to = Target(i);
    if (Ledger::Receive(to, std::move(stops_[i].bundle), current)) unsettled.push_back(&to);
    if (stops_[i].carried == OP_NONE) continue;
    carriers.push_back(std::make_shared<OP>(to.shared_from_this(), stops_[i].carried));
  }
  return carriers;
}

}  // namespace quarry::fileindex
