#include "base/section_grammar.h"
#include "base/section_reader.h"
#include "platform/core/file_replace.h"
#include "platform/core/section_text.h"
#include "platform/core/sz_list.h"
#include "platform/support/failure.h"

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <fcntl.h>

using namespace KovaPlatform;
using KOVA::Base::SectionReader;

namespace {

constexpr const char *kFile = "core/section_file.cpp";
// The results of a change. KLIBCFileEnumSection returns 0 on success.
constexpr int kDone = 1;
constexpr int kNoSection = 0;
constexpr int kFailed = -1;

// A try is repeated only when the path leads to another file than the one that was read. After so
// many in a row the path will not settle.
constexpr int kMaxTries = 100;

// Records why a file could not be read.
int failToRead() {
  return fail({errno == ENOMEM ? KLIBC_ERR_NO_MEMORY : KLIBC_ERR_READ, kFile});
}

// One byte more than the file's size, so that the read that finds the end needs no more room. The
// size is only a hint: the file may grow meanwhile, and those of /proc report 0. On 32-bit machines
// a file may be larger than the address space, and there is not enough memory for it then.
std::size_t roomFor(const RegularFile &file) {
  constexpr off_t kSmallest = 4095;
  const auto room = static_cast<std::uint64_t>(std::max(file.status.st_size, kSmallest)) + 1;
  return static_cast<std::size_t>(std::min<std::uint64_t>(room, SIZE_MAX));
}

// Reads the file, asks the editor for the new content and replaces the file with it. If another
// writer has replaced the file in the meantime, starts again with that writer's text. This makes
// lost updates rare; only a lock prevents them. The editor is called as
//     int edit(std::string_view text, std::string &storage, Content &content)
// and sets content, whose parts may point into text and storage. If it returns anything but kDone,
// that is the result and the file is left alone.
//
// The file is opened for writing although nothing is written to it. A rename needs permission on
// the directory only; opening for writing ensures that the caller may change the file itself.
template <typename Editor>
int editFile(const char *path, Editor edit) {
  for (int tries = 0; tries < kMaxTries; ++tries) {
    RegularFile file;
    if (!openRegular(path, O_RDWR, file)) {
      return kFailed;
    }
    SectionReader reader(file.fd.get(), roomFor(file));
    std::string_view text;
    if (!reader || reader.takeRest(text) == SectionReader::Read::Error) {
      return failToRead();
    }
    std::string storage;
    Content content;
    const int result = edit(text, storage, content);
    if (result != kDone) {
      return result;
    }
    const Located located = replaceContent(path, file, content);
    if (located != Located::Elsewhere) {
      return located == Located::Yes ? kDone : kFailed;
    }
  }
  return fail({KLIBC_ERR_BUSY, kFile});
}

// Checks the arguments that all changes have, then edits the file. A bad name is refused before the
// file is opened.
template <typename Editor>
int changeFile(const char *path, const char *name, Editor edit) noexcept {
  if (path == nullptr || name == nullptr) {
    return fail({KLIBC_ERR_BAD_PARAMETER, kFile});
  }
  if (!KOVA::Base::SectionGrammar::isStorableSectionName(name)) {
    return fail({KLIBC_ERR_BAD_SECTION_NAME, kFile});
  }
  return guarded({KLIBC_ERR_NO_MEMORY, kFile}, kFailed, [&] { return editFile(path, edit); });
}

int setSection(std::string_view text, std::string_view name, const KLIBCSzHash &hash,
               std::string &storage, Content &content) {
  const SectionParts parts = findSection(text, name);
  if (!parts.found) {
    return fail({KLIBC_ERR_NO_SECTION, kFile}, kNoSection);
  }
  if (parts.hidden) {
    return fail({KLIBC_ERR_SECTION_HIDDEN, kFile});
  }
  storage = rewriteSection(text, parts, hash);
  content = {parts.before, storage, parts.after};
  return kDone;
}

int addSection(std::string_view text, std::string_view name, const KLIBCSzHash &hash,
               std::string &storage, Content &content) {
  const SectionParts parts = findSection(text, name);
  if (parts.hidden || parts.found) {
    return fail({parts.hidden ? KLIBC_ERR_SECTION_HIDDEN : KLIBC_ERR_SECTION_EXISTS, kFile});
  }
  storage = newSection(text, name, hash);
  content = {text, storage, {}};
  return kDone;
}

// Unlike the other two, this accepts a hidden section: it writes no options that readers would fail
// to find.
int removeSection(std::string_view text, std::string_view name, Content &content) {
  const SectionParts parts = findSection(text, name);
  if (!parts.found) {
    return fail({KLIBC_ERR_NO_SECTION, kFile}, kNoSection);
  }
  content = {parts.before, parts.after, {}};
  return kDone;
}

} // namespace

int KLIBCFileEnumSection(const char *path, KLIBCSzList **list) {
  if (path == nullptr || list == nullptr || *list == nullptr) {
    return fail({KLIBC_ERR_BAD_PARAMETER, kFile});
  }
  return guarded({KLIBC_ERR_NO_MEMORY, kFile}, kFailed, [&] {
    RegularFile file;
    if (!openRegular(path, O_RDONLY, file)) {
      return kFailed;
    }
    SectionReader reader(file.fd.get());
    // Every list comes from KLIBCSzListAlloc, so it is a StringList. It grows in place, although
    // the interface would let it move.
    const bool isRead = reader && appendAll(*static_cast<StringList *>(*list),
                                            [&](auto &names) { return readNames(reader, names); });
    return isRead ? 0 : failToRead();
  });
}

int KLIBCFileSetSection(const char *path, const char *name, const char *reserved, KLIBCSzHash *hash,
                        int flags) {
  if (hash == nullptr || reserved != nullptr || flags != 0) {
    return fail({KLIBC_ERR_BAD_PARAMETER, kFile});
  }
  return changeFile(path, name, [&](std::string_view text, std::string &storage, Content &content) {
    return setSection(text, name, *hash, storage, content);
  });
}

int KLIBCFileAddSection(const char *path, const char *name, KLIBCSzHash *hash, int flags) {
  if (hash == nullptr || flags != 0) {
    return fail({KLIBC_ERR_BAD_PARAMETER, kFile});
  }
  return changeFile(path, name, [&](std::string_view text, std::string &storage, Content &content) {
    return addSection(text, name, *hash, storage, content);
  });
}

int KLIBCFileRemoveSection(const char *path, const char *name) {
  return changeFile(path, name, [&](std::string_view text, std::string &, Content &content) {
    return removeSection(text, name, content);
  });
}
