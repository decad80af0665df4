#ifndef KOVABACKUP_TESTS_FAKE_VOLUMES_H
#define KOVABACKUP_TESTS_FAKE_VOLUMES_H

/// @file A fake of the platform's volume services. The test programs define the functions, so that
/// a test sees the calls of the library and chooses their results.
///
///     FakeVolumes platform;
///     platform.volumes = {{"/volume1", 100, 2}};
///     platform.tmpPaths["/volume1"] = dir;
///     ...
///     EXPECT_EQ(1, platform.enumerations);
///
/// The destructor fails a test in which an enumeration was not freed exactly once.

#include <cstdint>
#include <map>
#include <string>
#include <vector>

namespace KovaTest {

/// One volume as the platform enumerates it.
struct FakeVolume {
  std::string mountPath;
  std::uint64_t size = 0;
  std::int32_t fsType = 2;
  std::uint32_t status = 1;
  std::uint32_t accessStatus = 1;
};

/// The results of the platform during its lifetime, and the calls that it received. One at a time.
class FakeVolumes {
public:
  FakeVolumes();
  ~FakeVolumes();
  FakeVolumes(const FakeVolumes &) = delete;
  FakeVolumes &operator=(const FakeVolumes &) = delete;

  /// Makes the directory the share temporary directory of a single ext4 volume "/volume1".
  explicit FakeVolumes(const std::string &dir);

  int supportedLocation = 1;
  std::vector<FakeVolume> volumes;
  std::map<std::string, std::string> tmpPaths; ///< by mount path; the call fails for others
  std::map<std::string, std::string> mountOf;  ///< by path; the call fails for others

  int enumerationError = 0; ///< if not 0, the enumeration fails with this code
  int locationError = 0;    ///< if not 0, the mask of locations leaves this code

  int success = 0;  ///< result of the two lookup services if they find something
  int failure = -1; ///< and if they do not

  int enumerations = 0;
  int reserved = -1;
  int location = -1;
  int enumFlags = -1;
  int lists = 0; ///< enumerations that returned a volume
  int freed = 0;
  std::vector<std::string> tmpPathsAsked;
};

/// A location mask that no other test has used, since results are cached for the process.
int freshLocation();

} // namespace KovaTest

#endif
