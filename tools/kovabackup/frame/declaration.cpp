#include "tools/kovabackup/frame/declaration.h"

#include <algorithm>

namespace KOVA::Backup::Tool {
namespace {

const Declaration &rootOf(const Declaration &at) {
  return at.parent == nullptr ? at : rootOf(*at.parent);
}

template <typename Matches>
const Option *findIn(const Declaration &at, Matches matches) {
  const auto found = std::find_if(at.options.begin(), at.options.end(), matches);
  return found == at.options.end() ? nullptr : &*found;
}

template <typename Matches>
const Option *findNearest(const Declaration &at, Matches matches) {
  const Option *own = findIn(at, matches);
  return own != nullptr ? own : findIn(rootOf(at), matches);
}

} // namespace

std::string commandName(const Declaration &at) {
  return at.parent == nullptr ? at.name : commandName(*at.parent) + " " + at.name;
}

const Declaration *findChild(const Declaration &group, const std::string &name) {
  const auto found = std::find_if(group.children.begin(), group.children.end(),
                                  [&name](const auto &child) { return child->name == name; });
  return found == group.children.end() ? nullptr : found->get();
}

std::vector<const Declaration *> visibleChildren(const Declaration &group) {
  std::vector<const Declaration *> visible;
  for (const auto &child : group.children) {
    if (!child->hidden) {
      visible.push_back(child.get());
    }
  }
  return visible;
}

const Argument *argumentAt(const Declaration &command, std::size_t index) {
  const std::vector<Argument> &declared = command.arguments;
  if (index < declared.size()) {
    return &declared[index];
  }
  return !declared.empty() && declared.back().repeats ? &declared.back() : nullptr;
}

const Option *findOption(const Declaration &at, const std::string &name) {
  return findNearest(at, [&name](const Option &option) { return option.name == name; });
}

const Option *findOption(const Declaration &at, char letter) {
  return findNearest(at, [letter](const Option &option) { return option.letter == letter; });
}

std::vector<const Option *> commonOptions(const Declaration &at) {
  std::vector<const Option *> common;
  for (const Option &option : rootOf(at).options) {
    const bool hidden = option.name == "--version" && at.parent != nullptr;
    if (!hidden && findOption(at, option.name) == &option) {
      common.push_back(&option);
    }
  }
  return common;
}

} // namespace KOVA::Backup::Tool
