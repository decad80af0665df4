// Many processes create, find, load and destroy sessions at the same time.

#include "tests/session/session_fixture.h"
#include "tests/session/session_ring.h"

#include <cerrno>

using namespace KOVA::Backup;
using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

constexpr int kProcesses = 8;
constexpr int kRounds = 250; // 2,000 sessions

enum class Kind { Local, Volume, VolumeWithTakenName };

bool create(Session &session, Kind kind, const boost::shared_ptr<FilterVolume> &filter) {
  if (kind == Kind::Local) {
    return session.create();
  }
  const Fault taken("symlink", kind == Kind::VolumeWithTakenName ? 1 : 0, EEXIST);
  return session.create(filter);
}

} // namespace

TEST_F(Sessions, OfManyProcessesAtOnceAreNeitherLostNorLeft) {
  const TestFolder scratch;
  FakeVolumes platform(volume.path);
  const std::string complaints = scratch / "complaints";
  const auto filter = anyVolume();
  {
    LogCapture log(complaints); // a log line counts as a complaint, too
    runRing({kProcesses, kRounds,
             [&](Session &session, int, int round) {
               return create(session, static_cast<Kind>(round % 3), filter);
             },
             complaints});
  }
  EXPECT_EQ("", readFile(complaints));
  EXPECT_THAT(namesIn("/tmp/kovabackup/session"), ElementsAre("__sess__.lock"));
  EXPECT_THAT(namesIn(volume.path), IsEmpty());
}
