// Writing the options of a map as one section. Each value becomes a text in the platform's hash,
// and the platform writes the hash into the file.

#include "base/json_text.h"
#include "base/unique_fd.h"
#include "common/log.h"
#include "kovabackup/option_map.h"
#include "kovaplatform/kovacore.h"
#include "option/option_map_private.h"

#include <fcntl.h>

namespace KOVA::Backup {
namespace {

constexpr int kFirstCapacity = 1024;
constexpr int kNoSuchSection = 0x2000;
constexpr mode_t kFileMode = 0644;

// The options of a map in the form that the platform takes.
class SectionHash {
public:
  SectionHash() : hash_(KLIBCSzHashAlloc(kFirstCapacity)) {}
  ~SectionHash() {
    if (hash_ != nullptr) {
      KLIBCSzHashFree(hash_);
    }
  }
  SectionHash(const SectionHash &) = delete;
  SectionHash &operator=(const SectionHash &) = delete;

  explicit operator bool() const { return hash_ != nullptr; }
  KLIBCSzHash *get() const { return hash_; }

  // Returns: false when the platform refuses the key or value; its last error says why.
  bool set(const std::string &key, const std::string &text) {
    return platformCanCarry(key, KLIBC_ERR_BAD_KEY, 692) &&
           KLIBCSzHashSetValue(&hash_, key.c_str(), text.c_str()) >= 0; // may replace hash_
  }

private:
  KLIBCSzHash *hash_;
};

// Returns: false for a value that has no form in a section. isInt and isUInt are true for 32 bits
// only, and for reals with an integral value in that range.
bool valueText(const Json::Value &value, std::string &text) {
  if (value.isString() || value.isArray()) {
    text = Base::JsonText::toText(value);
  } else if (value.isBool()) {
    text = value.asBool() ? "true" : "false";
  } else if (value.isInt()) {
    text = std::to_string(value.asInt64());
  } else if (value.isUInt()) {
    text = std::to_string(value.asUInt64());
  } else {
    return false;
  }
  return true;
}

void logPlatform(int number, const char *what) {
  const auto error = PlatformError::last();
  Log::error(kOptionModule, number, "%s: [0x%04X %s:%d]", what, error.code, error.file, error.line);
}

// Returns: false on failure, which is logged.
bool fillHash(const Json::Value &values, SectionHash &hash) {
  if (!values.isObject()) {
    return true; // no options
  }
  for (auto member = values.begin(); member != values.end(); ++member) {
    std::string text;
    if (!valueText(*member, text)) {
      Log::error(kOptionModule, 687, "unknown type key");
      return false;
    }
    if (!hash.set(member.name(), text)) {
      logPlatform(692, "KLIBCSzHashSetValue");
      return false;
    }
  }
  return true;
}

// The section to be written.
class SectionTarget {
public:
  SectionTarget(const std::string &path, const std::string &name) : path_(path), name_(name) {}

  // Returns: false on failure, which is logged.
  bool write(const SectionHash &hash, bool create) {
    errorBefore_ = KLIBCErrGet();
    const int result = set(hash);
    if (result == 1) {
      return true;
    }
    if (!create) {
      logPlatform(379, "KLIBFileSetSection failed.");
      return false;
    }
    return prepareToAdd(result) && add(hash);
  }

private:
  int set(const SectionHash &hash) const {
    return platformCanCarry(name_, KLIBC_ERR_BAD_SECTION_NAME, 379)
               ? KLIBCFileSetSection(path_.c_str(), name_.c_str(), nullptr, hash.get(), 0)
               : -1;
  }

  // Decides what a call that set nothing means. A missing file is made, and a missing section is to
  // be added; for both, the platform's last error is restored to what it was before the call. Any
  // other reason is a failure, which is logged.
  bool prepareToAdd(int setResult) const {
    const int code = KLIBCErrGet();
    if (setResult < 0) {
      return code == kNoSuchFile ? makeFile() : logSetFailed(392, setResult);
    }
    if (setResult > 0) {
      return true;
    }
    if (code != kNoSuchSection) {
      return logSetFailed(398, setResult);
    }
    KLIBCErrSetEx(errorBefore_, kOptionModule, 403);
    return true;
  }

  bool makeFile() const {
    const Base::UniqueFd file(::open(path_.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, kFileMode));
    if (!file) {
      Log::error(kOptionModule, 384, "create [%s] failed: %m", path_.c_str());
      return false;
    }
    KLIBCErrSetEx(errorBefore_, kOptionModule, 389);
    return true;
  }

  bool add(const SectionHash &hash) const {
    if (KLIBCFileAddSection(path_.c_str(), name_.c_str(), hash.get(), 0) >= 0) {
      return true;
    }
    const auto error = PlatformError::last();
    Log::error(kOptionModule, 408, "KLIBCFileAddSection(%s, %s): [0x%04X %s:%d]", path_.c_str(),
               name_.c_str(), error.code, error.file, error.line);
    return false;
  }

  bool logSetFailed(int number, int result) const {
    const auto error = PlatformError::last();
    Log::error(kOptionModule, number, "KLIBCFileSetSection(%s, %s)=%d: [0x%04X %s:%d]",
               path_.c_str(), name_.c_str(), result, error.code, error.file, error.line);
    return false;
  }

  const std::string &path_;
  const std::string &name_;
  int errorBefore_ = 0;
};

} // namespace

bool OptionMap::optSectionExport(const std::string &path, const std::string &name,
                                 bool create) const {
  SectionHash hash;
  if (!hash) {
    logPlatform(667, "KLIBCSzHashAlloc");
    return false;
  }
  return fillHash(d->values, hash) && SectionTarget(path, name).write(hash, create);
}

} // namespace KOVA::Backup
