#include "tools/kovabackup/facts/platform_error.h"

#include "kovaplatform/kovacore.h"
#ifdef KOVA_TOOL_STANDIN
#include "kovaplatform/kovanetsdk.h"
#include "kovaplatform/kovasdk.h"
#include "platform/config/config.h"
#include "tools/kovabackup/frame/text.h"

#include <cerrno>
#include <unistd.h>
#endif

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
      {KLIBC_ERR_BAD_PARAMETER, "the platform was called with an argument that it does not take"},
      {KLIBC_ERR_NO_MEMORY, "memory ran out"},
      {KLIBC_ERR_FORK, "no process can be created"},
      {KLIBC_ERR_BAD_KEY, "the option's name could not be read back from the file"},
      {KLIBC_ERR_BAD_VALUE, "the option's value could not be read back from the file"},
      {KLIBC_ERR_BAD_SECTION_NAME, "the section's name could not be read back from the file"},
      {KLIBC_ERR_SECTION_EXISTS, "the section already exists"},
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
      {KLIBC_ERR_CRYPT, "the encryption library cannot be initialised"},
      {KLIBC_ERR_BUFFER_SIZE, "the result of the encryption does not fit its buffer"},
      {KLIBC_ERR_BAD_CIPHER, "it is not a secret, was altered, or comes from another machine"},
      {KLIBC_ERR_KEY_UNSAFE, "the key file is not trusted: check its owner, mode and size"},
      {KLIBC_ERR_KEY_READ, "the key file cannot be read"},
      {KLIBC_ERR_KEY_MAKE, "the key file cannot be created"},
      {KOVA_SDK_ERR_ARGUMENT, "the platform was called with an argument that it does not take"},
      {KOVA_SDK_ERR_NO_MEMORY, "memory ran out"},
      {KOVA_SDK_ERR_MOUNTS, "the mount table cannot be read"},
      {KOVA_SDK_ERR_PATH, "the path cannot be resolved"},
      {KOVA_SDK_ERR_NO_VOLUME, "it is not on a volume"},
      {KOVA_SDK_ERR_TOO_LONG, "the mount path of its volume is too long"},
      {KOVA_SDK_ERR_TOO_SMALL, "the result does not fit its buffer"},
      {KOVA_SDK_ERR_TMP_DIR, "the temporary directory cannot be created"},
      {KOVA_SDK_ERR_NO_SHARE, "it is not in a share"},
      {KOVA_SDK_ERR_SIZE, "the size of the file system cannot be read"},
      {KOVA_CONF_ERR_OPEN, "the platform's configuration cannot be read"},
      {KOVA_CONF_ERR_UNSAFE,
       "the platform's configuration can be changed by other users, or is not "
       "a regular file"},
      {KOVA_CONF_ERR_SYNTAX, "the platform's configuration has a line that is not an option"},
      {KOVA_CONF_ERR_SECTION, "the platform's configuration has an unknown section"},
      {KOVA_CONF_ERR_KEY, "the platform's configuration has an unknown option"},
      {KOVA_CONF_ERR_VALUE, "the platform's configuration has a value of the wrong type"},
      {KOVA_CONF_ERR_NO_PATH, "the platform's configuration has a volume without a path"},
      {KOVA_CONF_ERR_TWICE, "the platform's configuration has a duplicate section"},
      {KOVA_CONF_ERR_NO_MEMORY, "memory ran out"},
      {KOVA_NET_ERR_ARGUMENT, "the platform was called with an argument that it does not take"},
      {KOVA_NET_ERR_NO_HOST, "there is no such host, or it has no address"},
      {KOVA_NET_ERR_TRY_AGAIN, "the name servers do not answer; try again later"},
      {KOVA_NET_ERR_RESOLVER, "the resolver failed"},
      {KOVA_NET_ERR_NO_MEMORY, "memory ran out"},
#endif
  };
  const auto found = kWords.find(code);
  return found == kWords.end() ? nullptr : found->second;
}

// Some records name a file without a line.
std::string place() {
  const int line = KLIBCErrorGetLine();
  const std::string file = KLIBCErrorGetFile();
  return line > 0 ? fmt::format("{}:{}", file, line) : file;
}

#ifdef KOVA_TOOL_STANDIN
bool isConfigurationRefused(int code) {
  return code >= KOVA_CONF_ERR_OPEN && code <= KOVA_CONF_ERR_TWICE;
}

// Asks the platform's own reader, which names the key or the section; the record says only of what
// kind the mistake is. Returns "" when the file has been corrected meanwhile.
std::string mistakeInConfiguration() {
  KovaPlatform::Config config;
  KovaPlatform::ConfigError error;
  return KovaPlatform::readConfig(config, error) ? "" : error.what;
}

// The record does not name the key file. What keeps a file from being created is usually its
// folder.
std::string aboutKeyFile(int code, const std::string &words) {
  static const std::string kSubject = "the key file";
  KovaPlatform::Config config;
  KovaPlatform::ConfigError ignored;
  if ((code != KLIBC_ERR_KEY_UNSAFE && code != KLIBC_ERR_KEY_READ && code != KLIBC_ERR_KEY_MAKE) ||
      !KovaPlatform::readConfig(config, ignored)) {
    return words;
  }
  const std::string file = KovaPlatform::secretKeyPath(config);
  const std::string folder = file.substr(0, file.rfind('/') + 1);
  std::string text = fmt::format("{} {}{}", kSubject, file, words.substr(kSubject.size()));
  if ((code == KLIBC_ERR_KEY_READ && ::access(file.c_str(), R_OK) != 0) ||
      (code == KLIBC_ERR_KEY_MAKE && ::access(folder.c_str(), W_OK | X_OK) != 0)) {
    text += ": " + reason(errno);
  }
  return text;
}
#endif

// What a person can act on; "" when nothing is known about the code.
std::string explanation(int code) {
  const char *words = wordsFor(code);
#ifdef KOVA_TOOL_STANDIN
  if (words != nullptr) {
    return aboutKeyFile(code, words);
  }
#endif
  return words == nullptr ? "" : words;
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
#ifdef KOVA_TOOL_STANDIN
  const std::string mistake = isConfigurationRefused(code) ? mistakeInConfiguration() : "";
  if (!mistake.empty()) { // the place is the user's own file, so it comes first
    return fmt::format("{}: {} (platform error 0x{:04x})", place(), mistake, code);
  }
#endif
  return platformError(explanation(code));
}

std::string platformError(const std::string &words) {
  const std::string number = fmt::format("platform error 0x{:04x} at {}", KLIBCErrGet(), place());
  return words.empty() ? number : fmt::format("{} ({})", words, number);
}

} // namespace KOVA::Backup::Tool
