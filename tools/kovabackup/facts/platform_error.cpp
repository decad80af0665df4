#include "tools/kovabackup/facts/platform_error.h"

#include "kovaplatform/kovacore.h"
#include "kovaplatform/kovasdk.h"

#include <fmt/format.h>
#include <map>

namespace KOVA::Backup::Tool {
namespace {

// The record holds a number and a source line, which mean something to the platform's developers
// but not to the person who reads the message.
const char *wordsFor(int code) {
  static const std::map<int, const char *> kWords = {
      {KLIBC_ERR_NO_FILE, "no such file"},
      {KLIBC_ERR_NO_SECTION, "no such section"},
#ifdef KOVA_TOOL_STANDIN // every platform defines the remaining codes itself
      {KLIBC_ERR_NO_MEMORY, "memory ran out"},
      {KLIBC_ERR_SECTION_HIDDEN, "a broken header above would be taken for the section's"},
      {KLIBC_ERR_OPEN, "the file cannot be opened"},
      {KLIBC_ERR_NOT_REGULAR, "it is not a regular file"},
      {KLIBC_ERR_READ, "the file cannot be read"},
      {KLIBC_ERR_CREATE, "no new file can be created beside it"},
      {KLIBC_ERR_WRITE, "the new content cannot be written"},
      {KLIBC_ERR_ATTRIBUTES, "owner, mode or an attribute of the file cannot be kept"},
      {KLIBC_ERR_SYNC, "the new content may not be on the disk"},
      {KLIBC_ERR_RENAME, "the new file cannot be put in place"},
      {KLIBC_ERR_DIR_SYNC, "the new content is in place, but may not outlast a power cut"},
      {KLIBC_ERR_BUSY, "other processes kept replacing the file"},
      {KLIBC_ERR_BAD_CIPHER, "it is not a secret, was altered, or comes from another machine"},
      {KLIBC_ERR_KEY_UNSAFE, "the key file is not trusted: check its owner, mode and size"},
      {KLIBC_ERR_KEY_READ, "the key file cannot be read"},
      {KLIBC_ERR_KEY_MAKE, "the key file cannot be created"},
      {KOVA_SDK_ERR_NO_VOLUME, "it is not on a volume"},
      {KOVA_SDK_ERR_TMP_DIR, "the temporary directory cannot be created"},
      {KOVA_CONF_ERR_OPEN, "the platform's configuration cannot be read"},
      {KOVA_CONF_ERR_UNSAFE, "the platform's configuration can be changed by other users"},
      {KOVA_CONF_ERR_SYNTAX, "the platform's configuration has a line that is not an option"},
      {KOVA_CONF_ERR_SECTION, "the platform's configuration has an unknown section"},
      {KOVA_CONF_ERR_KEY, "the platform's configuration has an unknown option"},
      {KOVA_CONF_ERR_VALUE, "the platform's configuration has a value of the wrong type"},
      {KOVA_CONF_ERR_NO_PATH, "the platform's configuration has a volume without a path"},
      {KOVA_CONF_ERR_TWICE, "the platform's configuration has a duplicate section"},
#endif
  };
  const auto found = kWords.find(code);
  return found == kWords.end() ? nullptr : found->second;
}

} // namespace

std::string platformErrorWords(int code) {
  const char *words = wordsFor(code);
  return words == nullptr ? "" : words;
}

void clearPlatformError() {
  KLIBCErrSetEx(0, "", 0);
}

bool hasPlatformError() {
  return KLIBCErrGet() != 0;
}

std::string platformError() {
  const int code = KLIBCErrGet();
  const std::string place = fmt::format("platform error 0x{:04x} at {}:{}", code,
                                        KLIBCErrorGetFile(), KLIBCErrorGetLine());
  const char *words = wordsFor(code);
  return words == nullptr ? place : fmt::format("{} ({})", words, place);
}

} // namespace KOVA::Backup::Tool
