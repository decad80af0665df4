#include "path/filter/literal_tries.h"

namespace KOVA::PatternSearch {
namespace {

// Makes room for more elements, at least doubling: a container's own reserve may grow to exactly
// what is asked for, and so copy all elements at each insertion.
template <typename Container>
void reserveMore(Container &container, std::size_t more) {
  const std::size_t needed = container.size() + more;
  if (needed > container.capacity()) {
    container.reserve(std::max(needed, container.capacity() * 2));
  }
}

} // namespace

void EdgeTable::reserve(std::size_t more) {
  constexpr std::size_t kFewest = 16;
  std::size_t size = std::max(slots_.size(), kFewest);
  while (size < (used_ + more) * 2) {
    size *= 2;
  }
  if (size == slots_.size()) {
    return;
  }
  std::vector<Slot> old(size);
  old.swap(slots_);
  for (const Slot &slot : old) {
    if (slot.to != kNone) {
      slots_[slotOf(slot.key)] = slot;
    }
  }
}

void EdgeTable::put(NodeId from, char byte, NodeId to) noexcept {
  const std::uint64_t key = keyOf(from, byte);
  Slot &slot = slots_[slotOf(key)];
  if (slot.to == kNone) {
    ++used_;
  }
  slot = {key, to};
}

NodeId LiteralTries::addRoot() {
  nodes_.emplace_back();
  return nodes_.size() - 1;
}

NodeId LiteralTries::insert(NodeId root, std::string_view key) {
  reserve(key.size());
  NodeId id = root;
  while (!key.empty()) {
    const NodeId below = edges_.find(id, key.front());
    if (below == kNone) {
      return addLeaf(id, key);
    }
    const std::string_view label =
        std::string_view(labels_).substr(nodes_[below].labelAt, nodes_[below].labelSize);
    const auto diverged = std::mismatch(label.begin(), label.end(), key.begin(), key.end());
    const auto common = static_cast<std::size_t>(diverged.first - label.begin());
    id = common < label.size() ? splitEdge(id, below, common) : below;
    key.remove_prefix(common);
  }
  return id;
}

// Reserves all that one insertion may need before anything changes: a split adds one node, and the
// leaf below it is another.
void LiteralTries::reserve(std::size_t keySize) {
  reserveMore(nodes_, 2);
  reserveMore(labels_, keySize);
  edges_.reserve(2);
}

NodeId LiteralTries::addLeaf(NodeId parent, std::string_view label) noexcept {
  const NodeId leaf = nodes_.size();
  nodes_.emplace_back();
  nodes_[leaf].labelAt = labels_.size();
  nodes_[leaf].labelSize = label.size();
  labels_.append(label);
  edges_.put(parent, label.front(), leaf);
  return leaf;
}

// Inserts a node into the edge to child, after the first size bytes of its label. The child keeps
// its number, so edges and users that refer to it stay valid.
NodeId LiteralTries::splitEdge(NodeId parent, NodeId child, std::size_t size) noexcept {
  const NodeId middle = nodes_.size();
  nodes_.emplace_back();
  nodes_[middle].labelAt = nodes_[child].labelAt;
  nodes_[middle].labelSize = size;
  edges_.put(parent, labels_[nodes_[middle].labelAt], middle);
  nodes_[child].labelAt += size;
  nodes_[child].labelSize -= size;
  edges_.put(middle, labels_[nodes_[child].labelAt], child);
  return middle;
}

} // namespace KOVA::PatternSearch
