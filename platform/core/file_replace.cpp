#include "platform/core/file_replace.h"

#include "base/retry_on_eintr.h"
#include "base/temp_file.h"
#include "platform/core/file_attributes.h"
#include "platform/core/temp_names.h"
#include "platform/support/failure.h"

#include <cerrno>
#include <unistd.h>

namespace KovaPlatform {
namespace {

using KOVA::Base::retryOnEintr;
using KOVA::Base::TempFile;

constexpr const char *kFile = "core/file_replace.cpp";

bool writeAll(int fd, std::string_view text) {
  while (!text.empty()) {
    const ssize_t wrote = retryOnEintr([&] { return ::write(fd, text.data(), text.size()); });
    if (wrote <= 0) { // 0 would repeat without end
      return false;
    }
    text.remove_prefix(static_cast<std::size_t>(wrote));
  }
  return true;
}

// Everything that belongs to the file, its attributes included, is in it and on the disk before it
// gets a name. So no reader ever opens it with a mode of 0600, and no power cut leaves a name
// without content.
bool fill(const TempFile &temp, const RegularFile &old, const Content &content) {
  for (const std::string_view part : content) {
    if (!writeAll(temp.fd(), part)) {
      return fail({KLIBC_ERR_WRITE, kFile}, false);
    }
  }
  if (!copyAttributes(old, temp.fd())) {
    return fail({KLIBC_ERR_ATTRIBUTES, kFile}, false);
  }
  // Never repeated: after a failure the kernel drops what it could not write, and a second call
  // would report success.
  return ::fsync(temp.fd()) == 0 || fail({KLIBC_ERR_SYNC, kFile}, false);
}

// NoLink: this kind of temporary file does not work here; the other kind may.
enum class Step { Done, NoLink, Failed };

Step tryKind(TempFile::Kind kind, const DirectoryEntry &entry, const RegularFile &old,
             const Content &content) {
  TempFile temp(entry.dir.get(), kTempPrefix);
  if (!temp.make(kind)) {
    return Step::NoLink;
  }
  if (!fill(temp, old, content)) {
    return Step::Failed;
  }
  if (!temp.link()) {
    return Step::NoLink;
  }
  return temp.rename(entry.name) ? Step::Done : fail({KLIBC_ERR_RENAME, kFile}, Step::Failed);
}

// An unnamed file is preferred, because a writer killed at work leaves nothing. Some file systems
// have none, and without privilege and /proc none can be linked; a named file takes its place then.
// A failure to write is not a reason to try again: it would meet the second file as well.
bool putInPlace(const DirectoryEntry &entry, const RegularFile &old, const Content &content) {
  KOVA::Base::clearLeftovers(entry.dir.get(), kTempPrefix);
  Step step = tryKind(TempFile::Kind::Unnamed, entry, old, content);
  if (step == Step::NoLink) {
    step = tryKind(TempFile::Kind::Named, entry, old, content);
  }
  return step == Step::Done || (step == Step::NoLink && fail({KLIBC_ERR_CREATE, kFile}, false));
}

// The rename itself is only durable once the directory is on the disk. File systems on which
// directories cannot be synced report EINVAL; nothing more can be done on them.
bool syncDirectory(const DirectoryEntry &entry) {
  return ::fsync(entry.dir.get()) == 0 || errno == EINVAL ||
         fail({KLIBC_ERR_DIR_SYNC, kFile}, false);
}

} // namespace

Located replaceContent(const char *path, const RegularFile &old, const Content &content) {
  DirectoryEntry entry;
  const Located located = locate(path, old, entry);
  if (located != Located::Yes) {
    return located;
  }
  const bool done = putInPlace(entry, old, content) && syncDirectory(entry);
  return done ? Located::Yes : Located::Failed;
}

} // namespace KovaPlatform
