#ifndef KOVABACKUP_TESTS_PLATFORM_CORE_SUPPORT_H
#define KOVABACKUP_TESTS_PLATFORM_CORE_SUPPORT_H

/// @file Shared by the tests of the core stand-in: the error record as a value, and hashes as lists
/// of pairs.

#include "kovaplatform/kovacore.h"
#include "tests/support/counting_loop.h"
#include "tests/support/files.h"

#include <string>
#include <utility>
#include <vector>

namespace KovaTest {

using Pairs = std::vector<std::pair<std::string, std::string>>;

/// Empties the error record, so that a test sees what the next call does to it.
inline void clearError() {
  KLIBCErrSetEx(0, "untouched", 7);
}

/// The code of the last error; -1 when the record is incomplete, as every failure records its
/// place.
inline int errorCode() {
  const int code = KLIBCErrGet();
  const std::string file = KLIBCErrorGetFile();
  if (code == 0) {
    return file == "untouched" && KLIBCErrorGetLine() == 7 ? 0 : -1;
  }
  return file.rfind("core/", 0) == 0 && KLIBCErrorGetLine() > 0 ? code : -1;
}

/// A hash that frees itself.
class Hash {
public:
  explicit Hash(const Pairs &pairs) : hash_(KLIBCSzHashAlloc(1024)) {
    for (const auto &[key, value] : pairs) {
      good_ = KLIBCSzHashSetValue(&hash_, key.c_str(), value.c_str()) >= 0 && good_;
    }
  }
  ~Hash() { KLIBCSzHashFree(hash_); }
  Hash(const Hash &) = delete;
  Hash &operator=(const Hash &) = delete;

  KLIBCSzHash *get() const { return hash_; }
  bool good() const { return good_; }

private:
  KLIBCSzHash *hash_;
  bool good_ = true;
};

inline int setSection(const std::string &path, const std::string &name, const Pairs &pairs) {
  const Hash hash(pairs);
  return hash.good() ? KLIBCFileSetSection(path.c_str(), name.c_str(), nullptr, hash.get(), 0) : -9;
}

inline int addSection(const std::string &path, const std::string &name, const Pairs &pairs) {
  const Hash hash(pairs);
  return hash.good() ? KLIBCFileAddSection(path.c_str(), name.c_str(), hash.get(), 0) : -9;
}

inline int removeSection(const std::string &path, const std::string &name) {
  return KLIBCFileRemoveSection(path.c_str(), name.c_str());
}

/// The names that the enumeration returns; ends with "<failed>" when it fails.
inline std::vector<std::string> sectionNames(const std::string &path) {
  KLIBCSzList *list = KLIBCSzListAlloc(4);
  std::vector<std::string> names;
  if (KLIBCFileEnumSection(path.c_str(), &list) < 0) {
    names.emplace_back("<failed>");
  }
  for (int i = 0; i < list->count; ++i) {
    names.emplace_back(KLIBCSzListGet(list, i));
  }
  KLIBCSzListFree(list);
  return names;
}

/// The counting loop for operations on files, which are set up and checked while nothing fails. The
/// constructor of a Scenario sets up; run() is called while the function fails, check(fired)
/// afterwards.
template <typename Scenario>
void failEachCall(const char *function, int error) {
  countFailures(function, Failing::OnceAndLasting, [&](int nth, bool lasting) {
    Scenario scenario;
    clearError();
    bool fired = false;
    {
      const Fault fault(function, nth, error, lasting);
      scenario.run();
      fired = fault.fired();
    }
    scenario.check(fired);
    return fired;
  });
}

} // namespace KovaTest

#endif
