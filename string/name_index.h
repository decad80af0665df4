#ifndef KOVABACKUP_STRING_NAME_INDEX_H
#define KOVABACKUP_STRING_NAME_INDEX_H

/// @file An index of names that is made for a single expansion of a template. A lookup in it costs
/// a fraction of one in the caller's container, which is a tree.
///
///     NameIndex<std::string_view> index(vars.size());
///     for (const auto &[name, value] : vars) {
///       index.add(name, value);
///     }
///     index.find("task", search);          // the value; {} when no name is equal
///
/// Owns:      its table, and neither names nor values.
/// Threads:   find from any thread once all names are added.
/// Failure:   throws only std::bad_alloc, when it is made.

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string_view>
#include <vector>

namespace KOVA::Backup {

/// A hash table that never grows. A name that finds all its places taken is left out, so that names
/// with equal hashes cannot make the index slow; it is then searched for in the container.
template <typename Value>
class NameIndex {
public:
  /// Makes room for this many names.
  explicit NameIndex(std::size_t names) : slots_(slotsFor(names)), mask_(slots_.size() - 1) {}

  /// Adds a name that was not added before. Its bytes must outlive the index.
  void add(std::string_view name, const Value &value) {
    std::size_t at = hash(name);
    for (std::size_t i = 0; i < kPlaces; ++i, ++at) {
      Slot &slot = slots_[at & mask_];
      if (slot.name.data() == nullptr) {
        slot = {name, value};
        return;
      }
    }
  }

  /// The value of name, Value{} when it has none, and what search(name) returns when the index does
  /// not know.
  template <typename Search>
  Value find(std::string_view name, Search search) const {
    std::size_t at = hash(name);
    for (std::size_t i = 0; i < kPlaces; ++i, ++at) {
      const Slot &slot = slots_[at & mask_];
      if (slot.name == name || slot.name.data() == nullptr) {
        return slot.value;
      }
    }
    return search(name);
  }

private:
  struct Slot {
    std::string_view name; // without data in a free slot
    Value value = {};
  };

  static constexpr std::size_t kPlaces = 8;

  // A power of two that leaves at least a third of the slots free.
  static std::size_t slotsFor(std::size_t names) {
    std::size_t slots = 2;
    while (slots < names + names / 2) {
      slots *= 2;
    }
    return slots;
  }

  template <typename Word>
  static std::uint64_t load(const char *bytes) {
    Word word = 0;
    std::memcpy(&word, bytes, sizeof word);
    return word;
  }

  // At most eight bytes as a number; the two halves may overlap.
  static std::uint64_t loadShort(std::string_view bytes) {
    if (bytes.size() >= sizeof(std::uint32_t)) {
      return load<std::uint32_t>(bytes.data()) << 32 |
             load<std::uint32_t>(bytes.data() + bytes.size() - sizeof(std::uint32_t));
    }
    std::uint64_t word = 0;
    for (const char byte : bytes) {
      word = word << 8 | static_cast<unsigned char>(byte);
    }
    return word;
  }

  // Faster than std::hash for names, which are short.
  static std::size_t hash(std::string_view name) {
    constexpr std::uint64_t kOdd = 0x9e3779b97f4a7c15;
    std::uint64_t hash = name.size();
    for (; name.size() > sizeof hash; name.remove_prefix(sizeof hash)) {
      hash = (hash ^ load<std::uint64_t>(name.data())) * kOdd;
      hash ^= hash >> 32;
    }
    hash = (hash ^ loadShort(name)) * kOdd;
    return static_cast<std::size_t>(hash >> 32); // the upper half depends on every byte
  }

  std::vector<Slot> slots_;
  std::size_t mask_;
};

} // namespace KOVA::Backup

#endif
