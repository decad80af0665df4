#include "service/tree_removal_path.h"

#include <climits>
#include <fcntl.h>
#include <utility>

namespace KOVA::Backup::Service {
namespace {

constexpr std::size_t kHeld = 8;

} // namespace

void RemovalPath::enter(Base::UniqueFd fd, const Level &level) {
  levels_.push_back(level);
  hold(levels_.size() - 1, std::move(fd));
}

// When there are too many, closes the one whose neighbours are closest to each other, compared with
// its distance from the deepest folder. The first and the last one stay.
void RemovalPath::hold(std::size_t level, Base::UniqueFd fd) {
  held_.push_back({level, std::move(fd)});
  if (held_.size() <= kHeld) {
    return;
  }
  const auto gap = [this](std::size_t at) { return held_[at + 1].level - held_[at - 1].level; };
  const auto distance = [&](std::size_t at) { return level - held_[at].level + 1; };
  std::size_t closest = 1;
  for (std::size_t at = 2; at + 1 < held_.size(); ++at) {
    if (gap(at) * distance(closest) < gap(closest) * distance(at)) {
      closest = at;
    }
  }
  held_.erase(held_.begin() + static_cast<std::ptrdiff_t>(closest));
}

bool RemovalPath::leave(FolderOpener &opener, const std::string &path) {
  held_.pop_back();
  levels_.pop_back();
  while (!levels_.empty() && held_.back().level + 1 < levels_.size()) {
    const std::size_t level = nextToOpen();
    const std::size_t start = levels_[held_.back().level].prefix + 1;
    const std::string names = path.substr(start, levels_[level].prefix - start);
    Base::UniqueFd opened;
    if (opener.open(fd(), names, O_PATH, FolderOpener::Mount::Same, opened)) {
      return false;
    }
    hold(level, std::move(opened));
  }
  return true;
}

// Half of the way down from the deepest open folder, as far as one path may be long.
std::size_t RemovalPath::nextToOpen() const noexcept {
  const std::size_t from = held_.back().level;
  std::size_t count = (levels_.size() - from) / 2;
  while (count > 1 && levels_[from + count].prefix - levels_[from].prefix > PATH_MAX) {
    count /= 2;
  }
  return from + count;
}

std::size_t RemovalPath::cut() {
  const std::size_t level = held_.back().level;
  const std::size_t due = levels_[level + 1].dueAbove;
  levels_.resize(level + 1);
  return due;
}

} // namespace KOVA::Backup::Service
