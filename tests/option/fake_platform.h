#ifndef KOVABACKUP_TESTS_FAKE_PLATFORM_H
#define KOVABACKUP_TESTS_FAKE_PLATFORM_H

/// @file A fake of the platform's core services. The test programs of this folder that list
/// fake_platform.cpp define the platform's functions, so that a test sees the calls of the library
/// and chooses their results.
///
///     class SectionList : public PlatformTest {};
///     ...
///     platform.sections = {"task1"};
///     platform.enumResult = -1; platform.enumCode = 0x1234;       // what a failing call records
///     EXPECT_THAT(log.take(), ElementsAre(errLine("option_map", 860, "...: " + kTriple)));
///
/// PlatformTest fails a test that leaves a list or a hash unfreed. A failing call of the platform
/// records its code with the place core/fake.c:77.

#include <functional>
#include <gtest/gtest.h>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace KovaTest {

using Pairs = std::vector<std::pair<std::string, std::string>>;

/// A call that writes a section.
struct SectionCall {
  std::string path;
  std::string name;
  Pairs pairs;
  bool reservedIsNull;
  int flags;
};

/// A call of KLIBCErrSetEx by the library.
struct ErrSet {
  int code;
  std::string file;
  int line;

  bool operator==(const ErrSet &other) const {
    return code == other.code && file == other.file && line == other.line;
  }
};
std::ostream &operator<<(std::ostream &os, const ErrSet &set);

/// A buffer that the library handed to an encryption or decryption.
struct CryptCall {
  std::string text;
  const void *buf;
  int size;
  bool zeroed;
};

struct FakePlatform {
  int code = 0; ///< of the last error
  std::string file;
  int line = 0;
  std::vector<ErrSet> errSets;

  bool listAllocFails = false;
  std::vector<std::optional<std::string>> sections; ///< nullopt: counted, but not returned
  int enumResult = 0;
  int enumCode = 0;
  std::vector<std::string> enumPaths;

  bool hashAllocFails = false;
  std::string refusedKey; ///< setting this key fails with setValueCode
  int setValueCode = 0;
  int setValueResult = 0; ///< for keys that are not refused

  int setResult = 1;
  int setCode = 0;
  int addResult = 0;
  int addCode = 0;
  int removeResult = 1;
  int removeCode = 0;
  std::vector<SectionCall> setCalls;
  std::vector<SectionCall> addCalls;
  std::vector<std::pair<std::string, std::string>> removeCalls;
  std::function<void()> duringWrite; ///< runs inside each call that changes a file

  int cryptCode = 0; ///< unless 0, encryption and decryption fail with it
  std::vector<CryptCall> encrypted;
  std::vector<CryptCall> decrypted;

  std::vector<int> capacities; ///< requested for lists and hashes
  int alive = 0;               ///< lists and hashes not yet freed
};

extern FakePlatform platform;

/// The triple of a platform call that failed with code 0x1234.
inline const std::string kTriple = "[0x1234 core/fake.c:77]";

/// The cipher text that the fake returns for a clear text.
std::string fakeCipher(const std::string &clear);

class PlatformTest : public testing::Test {
protected:
  PlatformTest() { platform = FakePlatform(); }
  ~PlatformTest() override { EXPECT_EQ(0, platform.alive) << "lists or hashes left"; }
};

} // namespace KovaTest

#endif
