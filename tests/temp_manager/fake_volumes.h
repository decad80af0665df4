#ifndef KOVABACKUP_TESTS_FAKE_VOLUMES_H
#define KOVABACKUP_TESTS_FAKE_VOLUMES_H

/// @file The platform's volume services as a test wants them: this folder's test programs define
/// them, so that what the library asks can be seen and what it is told be chosen.
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

/// What the platform answers while this stands, and what it was asked. One at a time.
class FakeVolumes {
public:
  FakeVolumes();
  ~FakeVolumes();
  FakeVolumes(const FakeVolumes &) = delete;
  FakeVolumes &operator=(const FakeVolumes &) = delete;

  /// A directory that is the share temporary directory of a lone ext4 volume "/volume1".
  explicit FakeVolumes(const std::string &dir);

  int supportedLocation = 1;
  std::vector<FakeVolume> volumes;
  std::map<std::string, std::string> tmpPaths; ///< by mount path; one without is a failure
  std::map<std::string, std::string> mountOf;  ///< by path; one without is a failure

  int success = 0;  ///< what the two services that look something up return when they find it,
  int failure = -1; ///< and when they do not

  int enumerations = 0;
  int reserved = -1;
  int location = -1;
  int enumFlags = -1;
  int lists = 0; ///< enumerations that found a volume
  int freed = 0;
  std::vector<std::string> tmpPathsAsked;
};

/// Location masks that no other test has used: results are remembered for the process.
int freshLocation();

} // namespace KovaTest

#endif
