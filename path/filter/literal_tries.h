#ifndef KOVABACKUP_PATH_FILTER_LITERAL_TRIES_H
#define KOVABACKUP_PATH_FILTER_LITERAL_TRIES_H

/// @file Compressed tries over byte strings. One store holds any number of them.
///
///     LiteralTries tries;
///     const NodeId root = tries.addRoot();
///     tries.node(tries.insert(root, "/volume1/")).first = 7;
///     tries.walk(root, path.begin(), path.end(), [](const LiteralTries::Node &node, auto end) {
///       return node.first == 7;                 // called for each key that is a prefix of path,
///     });                                       // with the place in path where the key ends
///
/// A node is named by its number and represents the key that leads to it from its root. An edge
/// carries all bytes up to the next place where keys end or differ. One table holds the edges of
/// all nodes, so a node costs only its share of three arrays, and a step down costs one probe.
///
/// Failure: addRoot and insert throw std::bad_alloc; every walk then finds what it found before.
/// Threads: walk only reads.

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

// Visible because the exported PathFilterPrivate has members of these types. They are not exported
// themselves: the library exports the namespace KOVA::Backup only, so they are in another one.
#pragma GCC visibility push(default)

namespace KOVA::PatternSearch {

using NodeId = std::size_t;
constexpr std::size_t kNone = static_cast<std::size_t>(-1);

/// Maps a node and a byte to the node below. A hash table with open addressing, at most half full.
class EdgeTable {
public:
  NodeId find(NodeId from, char byte) const noexcept {
    return slots_.empty() ? kNone : slots_[slotOf(keyOf(from, byte))].to;
  }

  /// Makes room for that many more edges, so that as many calls of put cannot fail.
  void reserve(std::size_t more);

  /// Sets where an edge leads.
  void put(NodeId from, char byte, NodeId to) noexcept;

private:
  struct Slot {
    std::uint64_t key = 0;
    NodeId to = kNone; // kNone: the slot is free
  };

  static std::uint64_t keyOf(NodeId from, char byte) noexcept {
    return (static_cast<std::uint64_t>(from) << 8) | static_cast<unsigned char>(byte);
  }

  // The slot that holds the key, or the free slot where the key belongs.
  std::size_t slotOf(std::uint64_t key) const noexcept {
    const std::size_t mask = slots_.size() - 1;
    const std::uint64_t mixed = key * 0x9e3779b97f4a7c15U; // 2^64 / golden ratio
    std::size_t at = static_cast<std::size_t>(mixed >> 32) & mask;
    while (slots_[at].to != kNone && slots_[at].key != key) {
      at = (at + 1) & mask;
    }
    return at;
  }

  std::vector<Slot> slots_; // their number is 0 or a power of two
  std::size_t used_ = 0;
};

class LiteralTries {
public:
  struct Node {
    std::size_t labelAt = 0; // the bytes on the edge to this node, the first one included
    std::size_t labelSize = 0;
    NodeId next = kNone;       // for the user: the root of a further trie
    std::size_t first = kNone; // for the user: the first entry of a list
  };

  NodeId addRoot();

  /// Returns: the node of key in the trie of root, which is made when it does not exist.
  NodeId insert(NodeId root, std::string_view key);

  Node &node(NodeId id) noexcept { return nodes_[id]; }
  const Node &node(NodeId id) const noexcept { return nodes_[id]; }
  NodeId idOf(const Node &node) const noexcept {
    return static_cast<NodeId>(&node - nodes_.data());
  }

  /// Visits the nodes whose keys are prefixes of the bytes from at to end, shortest key first,
  /// each with the place where its key ends, until visit returns true. Nodes at which keys only
  /// diverge are visited as well.
  /// Returns: whether visit returned true.
  template <typename Iterator, typename Visit>
  bool walk(NodeId root, Iterator at, Iterator end, Visit visit) const {
    return visit(nodes_[root], at) || walkBelow(root, at, end, visit);
  }

  /// Goes on with a walk from a node that it has visited.
  template <typename Iterator, typename Visit>
  bool walkBelow(NodeId id, Iterator at, Iterator end, Visit visit) const {
    while (at != end) {
      id = edges_.find(id, *at);
      if (id == kNone || !hasLabel(nodes_[id], at, end)) {
        return false;
      }
      at += static_cast<std::ptrdiff_t>(nodes_[id].labelSize);
      if (visit(nodes_[id], at)) {
        return true;
      }
    }
    return false;
  }

  /// Whether a key goes on from a node with all the bytes from at to end.
  /// at: before end.
  bool leadsOn(NodeId id, const char *at, const char *end) const {
    const NodeId below = edges_.find(id, *at);
    if (below == kNone) {
      return false;
    }
    const auto size = static_cast<std::size_t>(end - at);
    return labels_.compare(nodes_[below].labelAt, std::min(nodes_[below].labelSize, size), at,
                           std::min(nodes_[below].labelSize, size)) == 0;
  }

private:
  template <typename Iterator>
  bool hasLabel(const Node &node, Iterator at, Iterator end) const {
    const char *const label = labels_.data() + node.labelAt;
    const auto size = static_cast<std::ptrdiff_t>(node.labelSize);
    // The edge has compared the first byte. Most labels that differ do so in their last one, too.
    return end - at >= size && label[size - 1] == at[size - 1] &&
           (size <= 2 || std::equal(label + 1, label + size - 1, at + 1));
  }

  void reserve(std::size_t keySize);
  NodeId addLeaf(NodeId parent, std::string_view label) noexcept;
  NodeId splitEdge(NodeId parent, NodeId child, std::size_t size) noexcept;

  std::vector<Node> nodes_;
  EdgeTable edges_;
  std::string labels_;
};

} // namespace KOVA::PatternSearch

#pragma GCC visibility pop

#endif
