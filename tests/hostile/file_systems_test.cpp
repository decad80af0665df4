// File systems that lack what others have: links, modes, unnamed files, room; and layered ones.
#include "tests/hostile/surroundings.h"

#include "kovabackup/option_map.h"
#include "kovabackup/service/published_file.h"
#include "kovabackup/session.h"
#include "kovabackup/temp_manager.h"

#include <cstdlib>
#include <fcntl.h>
#include <filesystem>
#include <sys/mount.h>
#include <unistd.h>

namespace {

using namespace KovaTest;
using namespace KovaTest::Hostile;
using namespace KOVA::Backup;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
namespace fs = std::filesystem;

enum class Disk { Vfat, Overlay, Ext2 };

std::string nameOf(const testing::TestParamInfo<Disk> &info) {
  const char *const names[] = {"Vfat", "Overlay", "Ext2"};
  return names[static_cast<int>(info.param)];
}

/// The parameter is the file system of the volume.
class HostileDisk : public HostileTest, public testing::WithParamInterface<Disk> {
protected:
  void SetUp() override {
    HostileTest::SetUp();
    if (!IsSkipped()) {
      KOVA_OR_SKIP(mountDisk());
    }
  }
  void TearDown() override {
    ::umount2(volume().c_str(), MNT_DETACH); // which also releases the loop device
    HostileTest::TearDown();
  }

  // vfat has neither links nor modes, this ext2 no extended attributes and no unnamed files.
  static void mountDisk() {
    const std::string place = stage() + "/disk";
    if (GetParam() == Disk::Vfat) {
      mountImage("mkfs.vfat", "vfat");
    } else if (GetParam() == Disk::Ext2) {
      mountImage("mkfs.ext2 -q -O ^ext_attr", "ext2");
    } else {
      for (const std::string part : {"/lower", "/upper", "/work"}) {
        fs::create_directories(place + part);
      }
      const std::string options =
          "lowerdir=" + place + "/lower,upperdir=" + place + "/upper,workdir=" + place + "/work";
      need(::mount("overlay", volume().c_str(), "overlay", 0, options.c_str()) == 0, "overlay");
    }
  }

  static void mountImage(const std::string &make, const std::string &type) {
    const std::string image = stage() + "/image";
    const std::string commands = "truncate -s 4M " + image + " && " + make + " " + image +
                                 " >/dev/null && mount -o loop -t " + type + " " + image + " " +
                                 volume();
    if (std::system(("{ " + commands + "; } 2>/dev/null").c_str()) != 0) {
      throw Lacking(type + " cannot be mounted");
    }
    fs::remove(volume() + "/lost+found");
  }

  const std::string file_ = volume() + "/task.conf";
};

TEST_P(HostileDisk, ASectionIsReplacedAndNothingIsLeft) {
  writeFile(file_, "[s]\nk=\"a\"\n");
  const Outcome outcome = runCommand({"option", "set", file_, "s", "k", "b"});
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_EQ("[s]\nk=\"b\"\n", readFile(file_));
  EXPECT_THAT(namesIn(volume()), ElementsAre("task.conf"));
}

TEST_P(HostileDisk, ASessionIsCreatedFoundAndDestroyed) {
  const Outcome outcome = runLibrary([] {
    Session made;
    Session found;
    return made.create(TempManager::maxVolume()) && found.load(made.getId()) && found.destroy();
  });
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_THAT(namesIn(volume() + "/.kova_tmp"), IsEmpty());
}

TEST_P(HostileDisk, ASessionIsRemovedByTheCommandWithItsFiles) {
  const Outcome made = runCommand({"session", "create", "--volume", "max"});
  const std::string id = made.out.substr(0, made.out.find('\n'));
  writeFile(volume() + "/.kova_tmp/" + id + "/file", "data");
  const Outcome outcome = runCommand({"session", "destroy", id});
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_THAT(namesIn(volume() + "/.kova_tmp"), IsEmpty());
  EXPECT_THAT(namesIn(kSessionRoot), IsEmpty());
}

TEST_P(HostileDisk, AFileIsPublishedAndReplaced) {
  const Outcome outcome = runLibrary([] {
    for (const std::string content : {"one", "two"}) {
      Service::PublishedFile file(volume() + "/archive");
      Service::Error error;
      if (!file.create(error) || ::write(file.fd(), content.data(), 3) != 3 ||
          !file.publish(error)) {
        return false;
      }
    }
    return true;
  });
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_EQ("two", readFile(volume() + "/archive"));
}

TEST_P(HostileDisk, AKeyIsMadeAndServesOrThereIsNone) {
  const std::string key = volume() + "/secret.key";
  writeFile(configuration(), "[secret]\nkeyFile=\"" + key + "\"\n");
  const Outcome outcome = runLibrary([] {
    OptionMap map;
    return map.optSet("secret", "open sesame", true) &&
           map.optSecret("secret", "") == "open sesame";
  });
  const std::set<std::string> names = namesIn(volume());
  EXPECT_EQ(outcome.exitCode == 0 ? 1U : 0U, names.count("secret.key")) << outcome;
  EXPECT_EQ(outcome.exitCode == 0, outcome.log.empty()) << "a failure has its line";
  for (const std::string &name : names) {
    EXPECT_THAT(name, testing::Not(HasSubstr(".tmp")));
  }
}

INSTANTIATE_TEST_SUITE_P(Of, HostileDisk, testing::Values(Disk::Vfat, Disk::Overlay, Disk::Ext2),
                         nameOf);

class HostileFullDisk : public HostileTest {
protected:
  // A volume without a free byte.
  static void fill() {
    mountOn(volume(), "size=64k,mode=0755");
    const int fd = ::open((volume() + "/fill").c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600);
    const std::string block(4096, 'x');
    while (::write(fd, block.data(), block.size()) > 0) {
    }
    ::close(fd);
  }
};

TEST_F(HostileFullDisk, NoFileIsBegunForWhichThereIsNoRoom) {
  KOVA_OR_SKIP(fill());
  const Outcome outcome = runLibrary([] {
    Service::PublishedFile file(volume() + "/archive");
    Service::Error error;
    return !file.create(error, 1) && error.code == ENOSPC;
  });
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_THAT(namesIn(volume()), ElementsAre("fill"));
}

TEST_F(HostileFullDisk, TheSessionsOnItAreRemoved) {
  KOVA_OR_SKIP(mountOn(volume(), "size=64k,mode=0755"));
  ASSERT_EQ(0, runCommand({"session", "create", "--volume", "max"}).exitCode);
  const std::string id = *namesIn(kSessionRoot).begin();
  const std::string block(65536, 'x');
  std::FILE *const file = std::fopen((volume() + "/.kova_tmp/" + id + "/f").c_str(), "we");
  (void)std::fwrite(block.data(), block.size(), 1, file);
  (void)std::fclose(file);
  EXPECT_EQ(0, runCommand({"session", "prune", "--older-than", "0s", "--yes"}).exitCode);
  EXPECT_THAT(namesIn(volume() + "/.kova_tmp"), IsEmpty());
}

TEST_F(HostileFullDisk, TheCommandNamesIt) {
  KOVA_OR_SKIP(mountOn(volume(), "size=64k,mode=0755"));
  const std::string file = writeFile(volume() + "/task.conf", "[s]\nk=\"a\"\n");
  writeFile(volume() + "/small", std::string(52000, 'x'));
  const Outcome outcome = runCommand({"option", "set", file, "s", "k", std::string(30000, 'y')});
  EXPECT_EQ(1, outcome.exitCode) << outcome;
  EXPECT_EQ("[s]\nk=\"a\"\n", readFile(file));
  EXPECT_THAT(namesIn(volume()), ElementsAre("small", "task.conf"));
}

} // namespace
