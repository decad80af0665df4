#ifndef KOVABACKUP_TESTS_PLATFORM_CORE_SUPPORT_H
#define KOVABACKUP_TESTS_PLATFORM_CORE_SUPPORT_H

/// @file What the tests of the core stand-in share: the error record as a value, files as texts,
/// hashes as lists of pairs, and a directory that is removed at the end of the test.

#include "kovaplatform/kovacore.h"
#include "tests/support/fault.h"

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <sstream>
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

inline void writeText(const std::string &path, const std::string &text) {
  std::ofstream(path, std::ios::binary) << text;
}

inline std::string readText(const std::string &path) {
  std::ifstream in(path, std::ios::binary);
  if (!in) {
    return "<no such file>";
  }
  std::ostringstream out;
  out << in.rdbuf();
  return out.str();
}

/// The test's own directory, removed with everything in it.
class TestDir {
public:
  TestDir() { std::filesystem::create_directories(path_); }
  ~TestDir() { std::filesystem::remove_all(path_); }
  TestDir(const TestDir &) = delete;
  TestDir &operator=(const TestDir &) = delete;

  std::string operator/(const std::string &name) const { return path_ + "/" + name; }

  /// The names in it, sorted.
  std::vector<std::string> names() const {
    std::vector<std::string> found;
    for (const auto &entry : std::filesystem::directory_iterator(path_)) {
      found.push_back(entry.path().filename());
    }
    std::sort(found.begin(), found.end());
    return found;
  }

private:
  std::string path_ = "/tmp/core_test";
};

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

/// The counting loop of tests/support/fault.h for operations on files, whose files must be created
/// and examined while nothing fails. A Scenario creates them; run() is called while the function
/// fails, check(fired) afterwards.
template <typename Scenario>
void failEachCall(const char *function, int error) {
  constexpr int kMostCalls = 1000;
  for (const bool lasting : {false, true}) {
    bool fired = true;
    for (int nth = 1; fired; ++nth) {
      ASSERT_LE(nth, kMostCalls) << function << " is called without end";
      SCOPED_TRACE(testing::Message()
                   << function << " fails at call " << nth << (lasting ? " and after" : ""));
      Scenario scenario;
      clearError();
      {
        Fault fault(function, nth, error, lasting);
        scenario.run();
        fired = fault.fired();
      }
      EXPECT_TRUE(fired || nth > 1) << function << " is not called at all: the loop proves nothing";
      scenario.check(fired);
    }
  }
}

} // namespace KovaTest

#endif
