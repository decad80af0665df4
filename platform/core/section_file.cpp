#include "base/section_grammar.h"
#include "platform/core/file_replace.h"
#include "platform/core/section_text.h"
#include "platform/core/sz_list.h"
#include "platform/support/failure.h"

#include <fcntl.h>

using namespace KovaPlatform;

namespace {

constexpr const char *kFile = "core/section_file.cpp";
constexpr int kDone = 1;
constexpr int kNoSection = 0;
constexpr int kFailed = -1;
constexpr int kMaxTries = 100;

// Reads the file, asks the editor for its new content and puts that in place; anew when another
// writer replaced the file in between. The editor is called as
//     int edit(std::string_view text, std::string &own, Content &content)
// where own may hold what content refers to; what is not kDone ends the whole with that result.
template <typename Editor>
int editFile(const char *path, Editor edit) {
  for (int tries = 0; tries < kMaxTries; ++tries) {
    RegularFile file;
    std::string text;
    if (!openRegular(path, O_RDWR, file) || !readAll(file, text)) {
      return kFailed;
    }
    std::string own;
    Content content;
    const int result = edit(text, own, content);
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

// Checks what is common to all changes, then makes one.
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
               std::string &own, Content &content) {
  const SectionParts parts = findSection(text, name);
  if (!parts.found) {
    return fail({KLIBC_ERR_NO_SECTION, kFile}, kNoSection);
  }
  if (parts.hidden) {
    return fail({KLIBC_ERR_SECTION_HIDDEN, kFile});
  }
  own = rewriteSection(text, parts, hash);
  content = {parts.before, own, parts.after};
  return kDone;
}

int addSection(std::string_view text, std::string_view name, const KLIBCSzHash &hash,
               std::string &own, Content &content) {
  const SectionParts parts = findSection(text, name);
  if (parts.hidden || parts.found) {
    return fail({parts.hidden ? KLIBC_ERR_SECTION_HIDDEN : KLIBC_ERR_SECTION_EXISTS, kFile});
  }
  own = newSection(text, name, hash);
  content = {text, own, {}};
  return kDone;
}

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
    std::string text;
    if (!openRegular(path, O_RDONLY, file) || !readAll(file, text)) {
      return kFailed;
    }
    appendAll(*static_cast<StringList *>(*list), sectionNames(text));
    return 0;
  });
}

int KLIBCFileSetSection(const char *path, const char *name, const char *reserved, KLIBCSzHash *hash,
                        int flags) {
  if (hash == nullptr || reserved != nullptr || flags != 0) {
    return fail({KLIBC_ERR_BAD_PARAMETER, kFile});
  }
  return changeFile(path, name, [&](std::string_view text, std::string &own, Content &content) {
    return setSection(text, name, *hash, own, content);
  });
}

int KLIBCFileAddSection(const char *path, const char *name, KLIBCSzHash *hash, int flags) {
  if (hash == nullptr || flags != 0) {
    return fail({KLIBC_ERR_BAD_PARAMETER, kFile});
  }
  return changeFile(path, name, [&](std::string_view text, std::string &own, Content &content) {
    return addSection(text, name, *hash, own, content);
  });
}

int KLIBCFileRemoveSection(const char *path, const char *name) {
  return changeFile(path, name, [&](std::string_view text, std::string &, Content &content) {
    return removeSection(text, name, content);
  });
}
