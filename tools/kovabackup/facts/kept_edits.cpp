#include "tools/kovabackup/facts/kept_edits.h"

#include "base/unique_fd.h"
#include "kovabackup/path_util.h"
#include "tools/kovabackup/facts/folder_names.h"
#include "tools/kovabackup/frame/text_editor.h"

#include <algorithm>
#include <ctime>
#include <fcntl.h>
#include <fmt/format.h>
#include <optional>
#include <sys/stat.h>
#include <unistd.h>

namespace KOVA::Backup::Tool {
namespace {

using Base::UniqueFd;

// Other users may create anything in /tmp, so no link is followed, no FIFO is waited for, and no
// more is read than a subject can have.
std::string subjectIn(const UniqueFd &folder) {
  constexpr std::size_t kMostBytes = 8192;
  const UniqueFd fd(::openat(folder.get(), EditedText::kSubjectName,
                             O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
  std::string text(kMostBytes, '\0');
  const ssize_t count = fd ? ::read(fd.get(), text.data(), text.size()) : 0;
  text.resize(count > 0 ? static_cast<std::size_t>(count) : 0);
  return text;
}

std::optional<KeptEdit> readKeptEdit(const std::string &path) {
  const UniqueFd folder(
      ::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
  struct stat info = {};
  if (!folder || EditedText::isOpen(folder.get()) ||
      ::fstatat(folder.get(), EditedText::kTextName, &info, AT_SYMLINK_NOFOLLOW) != 0 ||
      !S_ISREG(info.st_mode)) {
    return std::nullopt;
  }
  return KeptEdit{Path::join(path, EditedText::kTextName), path, subjectIn(folder),
                  std::chrono::seconds(std::time(nullptr) - info.st_mtime)};
}

} // namespace

std::string textSubject(const std::string &file, const std::string &section) {
  return fmt::format("section '{}' of {}", section, Path::absPath(file));
}

std::vector<KeptEdit> keptEdits() {
  std::vector<KeptEdit> edits;
  std::vector<std::string> names;
  (void)addNamesIn("/tmp", names); // what cannot be read is not reported here
  for (const std::string &name : names) {
    const std::string path = Path::join("/tmp", name);
    if (path.rfind(EditedText::kFolderPrefix, 0) == 0) {
      if (std::optional<KeptEdit> edit = readKeptEdit(path)) {
        edits.push_back(std::move(*edit));
      }
    }
  }
  std::sort(edits.begin(), edits.end(),
            [](const KeptEdit &a, const KeptEdit &b) { return b.age < a.age; });
  return edits;
}

} // namespace KOVA::Backup::Tool
