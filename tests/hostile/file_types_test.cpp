// Something else where a file is expected: FIFOs, devices, directories, sockets, links. Nothing
// waits for ever, nothing reads without end, and what is there stays as it is.
#include "tests/hostile/surroundings.h"

#include "kovabackup/option_map.h"
#include "kovabackup/service/published_file.h"
#include "kovabackup/service/run_lock.h"

#include <fcntl.h>
#include <filesystem>
#include <linux/fs.h>
#include <sys/ioctl.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

namespace {

using namespace KovaTest;
using namespace KovaTest::Hostile;
using namespace KOVA::Backup;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::StartsWith;
namespace fs = std::filesystem;

enum class Kind { Fifo, Folder, Socket, LinkLoop, Zero, Null };

void make(Kind kind, const std::string &path) {
  switch (kind) {
  case Kind::Fifo:
    ASSERT_EQ(0, ::mkfifo(path.c_str(), 0600));
    break;
  case Kind::Folder:
    fs::create_directory(path);
    break;
  case Kind::Socket: {
    struct sockaddr_un address = {};
    address.sun_family = AF_UNIX;
    path.copy(address.sun_path, sizeof address.sun_path - 1);
    const int fd = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    EXPECT_EQ(0, ::bind(fd, reinterpret_cast<struct sockaddr *>(&address), sizeof address));
    ::close(fd);
    break;
  }
  case Kind::LinkLoop:
    fs::create_symlink(path, path);
    break;
  case Kind::Zero:
    fs::create_symlink("/dev/zero", path);
    break;
  case Kind::Null:
    fs::create_symlink("/dev/null", path);
    break;
  }
}

std::string nameOf(const testing::TestParamInfo<Kind> &info) {
  const char *const names[] = {"Fifo", "Folder", "Socket", "LinkLoop", "Zero", "Null"};
  return names[static_cast<int>(info.param)];
}

/// The parameter is what has the place of a file.
class HostileFile : public HostileTest, public testing::WithParamInterface<Kind> {
protected:
  void SetUp() override {
    HostileTest::SetUp();
    if (!IsSkipped()) {
      make(GetParam(), path_);
      ::lstat(path_.c_str(), &before_);
    }
  }
  // Still the same, and nothing is beside it.
  void expectUntouched() const {
    struct stat now = {};
    EXPECT_EQ(0, ::lstat(path_.c_str(), &now));
    EXPECT_EQ(before_.st_ino, now.st_ino);
    EXPECT_EQ(before_.st_mode, now.st_mode);
    EXPECT_EQ(left(), std::set<std::string>{path_});
  }

  const std::string path_ = stage() + "/thing";
  struct stat before_ = {};
};

TEST_P(HostileFile, AsASectionFileIsNotChanged) {
  const Outcome outcome = runCommand({"option", "set", path_, "task1", "a", "b"});
  EXPECT_EQ(1, outcome.exitCode) << outcome;
  EXPECT_THAT(outcome.messages, GetParam() == Kind::LinkLoop
                                    ? HasSubstr("Too many levels of symbolic links")
                                    : HasSubstr("is not a regular file"));
  expectUntouched();
}

TEST_P(HostileFile, AsASectionFileIsNotLoaded) {
  const Outcome outcome = runLibrary([&] { return OptionMap().optSectionLoad(path_, "task", 1); },
                                     [] { limit(RLIMIT_AS, 1UL << 30); });
  EXPECT_EQ(1, outcome.exitCode) << outcome;
  expectUntouched();
}

TEST_P(HostileFile, AsASectionFileIsNotSaved) {
  const Outcome outcome = runLibrary([&] {
    OptionMap map;
    return map.optSet("a", "b") && map.optSectionExport(path_, "task1", false);
  });
  EXPECT_EQ(1, outcome.exitCode) << outcome;
  EXPECT_THAT(outcome.log,
              ElementsAre(StartsWith("[err] option_map:379 KLIBFileSetSection failed")));
  expectUntouched();
}

TEST_P(HostileFile, AsAKeyFileMakesNoSecretAndNoOtherKey) {
  writeFile(configuration(), "[secret]\nkeyFile=\"" + path_ + "\"\n");
  const Outcome outcome = runLibrary([] {
    OptionMap map;
    (void)map.optSet("secret", "open sesame", true);
    return map.optString("secret", "none").empty();
  });
  EXPECT_EQ(0, outcome.exitCode) << "it is stored as an empty text" << outcome;
  EXPECT_FALSE(outcome.log.empty());
  expectUntouched();
}

TEST_P(HostileFile, AsAKeyFileIsWrongToTheDoctor) {
  writeFile(configuration(), "[secret]\nkeyFile=\"" + path_ + "\"\n");
  const Outcome outcome = runCommand({"doctor"});
  EXPECT_EQ(3, outcome.exitCode);
  EXPECT_THAT(outcome.out, HasSubstr("wrong\tkey file\t")) << outcome;
  expectUntouched();
}

TEST_P(HostileFile, AsAConfigurationGivesNoVolumesAndItsReason) {
  const Outcome outcome = runProgram(
      {{"kovabackup", "volume", "list"}, {"PATH=/usr/bin", "KOVA_PLATFORM_CONF=" + path_}});
  EXPECT_EQ(1, outcome.exitCode) << outcome;
  const bool opens = GetParam() != Kind::Socket && GetParam() != Kind::LinkLoop;
  EXPECT_THAT(outcome.messages, HasSubstr(opens ? ": not a regular file" : ": cannot be opened: "));
  expectUntouched();
}

TEST_P(HostileFile, AsTheTargetOfAPublishedFileIsReplacedUnlessItIsAFolder) {
  const Outcome outcome = runLibrary([&] {
    Service::PublishedFile file(path_);
    Service::Error error;
    return file.create(error) && ::write(file.fd(), "data", 4) == 4 && file.publish(error);
  });
  if (GetParam() == Kind::Folder) {
    EXPECT_EQ(1, outcome.exitCode);
    expectUntouched();
  } else {
    EXPECT_EQ(0, outcome.exitCode) << outcome;
    EXPECT_EQ("data", readFile(path_)) << "the link itself is replaced, and no device is written";
    EXPECT_FALSE(fs::is_symlink(path_));
  }
}

INSTANTIATE_TEST_SUITE_P(Is, HostileFile,
                         testing::Values(Kind::Fifo, Kind::Folder, Kind::Socket, Kind::LinkLoop,
                                         Kind::Zero, Kind::Null),
                         nameOf);

class HostileInput : public HostileTest {};

TEST_F(HostileInput, WithoutEndIsNotReadForPatterns) {
  const Outcome outcome = runCommand({"filter", "test", "--patterns", "/dev/zero"});
  EXPECT_EQ(1, outcome.exitCode);
  EXPECT_EQ("kovabackup: cannot read /dev/zero: it is a device\n", outcome.messages);
}

TEST_F(HostileInput, WithoutEndIsNotReadAsATemplate) {
  const Outcome outcome = runCommand({"template", "fill", "/dev/zero"});
  EXPECT_EQ(1, outcome.exitCode);
  EXPECT_EQ("kovabackup: cannot read /dev/zero: it is a device\n", outcome.messages);
}

TEST_F(HostileInput, OfNothingIsRead) {
  EXPECT_EQ(0, runCommand({"filter", "test", "--patterns", "/dev/null"}).exitCode);
}

TEST_F(HostileInput, FromAPipeIsRead) {
  const Outcome outcome =
      runProgram({{"kovabackup", "filter", "test", "--patterns", "/proc/self/fd/0"},
                  Program::usual(),
                  Program::command(),
                  "- /a\n"});
  EXPECT_EQ(0, outcome.exitCode) << outcome;
}

TEST_F(HostileInput, ThatIsAFolderIsNamed) {
  for (const std::vector<std::string> &words :
       std::vector<std::vector<std::string>>{{"filter", "test", "--patterns", "/tmp"},
                                             {"template", "fill", "/tmp"},
                                             {"template", "fill", "--json", "/tmp", "/dev/null"}}) {
    const Outcome outcome = runCommand(words);
    EXPECT_EQ(1, outcome.exitCode);
    EXPECT_EQ("kovabackup: cannot read /tmp: Is a directory\n", outcome.messages);
  }
}

// A file that not even root changes; released at the end, since it could not be removed.
class Protection {
public:
  Protection(const std::string &path, int flag) : path_(path) { set(flag); }
  ~Protection() { set(0); }
  Protection(const Protection &) = delete;
  Protection &operator=(const Protection &) = delete;

private:
  void set(int flags) const {
    const int fd = ::open(path_.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC);
    const bool done = ::ioctl(fd, FS_IOC_SETFLAGS, &flags) == 0;
    ::close(fd);
    need(done || flags == 0, "chattr");
  }
  const std::string path_;
};

class HostileProtection : public HostileTest {
protected:
  Outcome change() const { return runCommand({"option", "set", file_, "task1", "name", "b"}); }

  const std::string file_ = stage() + "/task.conf";
  const std::string content_ = "[task1]\nname=\"a\"\n";
};

TEST_F(HostileProtection, OfTheSectionFileIsNamed) {
  writeFile(file_, content_);
  try {
    const Protection protection(file_, FS_IMMUTABLE_FL);
    const Outcome outcome = change();
    EXPECT_EQ(1, outcome.exitCode);
    EXPECT_THAT(outcome.messages, HasSubstr("Operation not permitted")) << outcome;
  } catch (const Lacking &why) {
    GTEST_SKIP() << "skipped: " << why.what();
  }
  EXPECT_EQ(content_, readFile(file_));
  EXPECT_EQ(left(), std::set<std::string>{file_});
}

TEST_F(HostileProtection, OfTheSectionFileAgainstAllButAppendingKeepsIt) {
  writeFile(file_, content_);
  try {
    const Protection protection(file_, FS_APPEND_FL);
    EXPECT_EQ(1, change().exitCode);
  } catch (const Lacking &why) {
    GTEST_SKIP() << "skipped: " << why.what();
  }
  EXPECT_EQ(content_, readFile(file_));
  EXPECT_EQ(left(), std::set<std::string>{file_});
}

TEST_F(HostileProtection, OfTheFolderIsNamed) {
  writeFile(file_, content_);
  try {
    const Protection protection(stage(), FS_IMMUTABLE_FL);
    const Outcome outcome = change();
    EXPECT_EQ(1, outcome.exitCode);
    EXPECT_THAT(outcome.messages, HasSubstr("Operation not permitted")) << outcome;
    EXPECT_EQ(1, runCommand({"option", "set", stage() + "/new", "a", "b", "c"}).exitCode);
  } catch (const Lacking &why) {
    GTEST_SKIP() << "skipped: " << why.what();
  }
  EXPECT_EQ(content_, readFile(file_));
  EXPECT_EQ(left(), std::set<std::string>{file_});
}

// There a file gets a name, but can neither be renamed nor removed.
TEST_F(HostileProtection, OfTheFolderAgainstAllButAddingLeavesANameForTheNextWriter) {
  writeFile(file_, content_);
  try {
    const Protection protection(stage(), FS_APPEND_FL);
    EXPECT_EQ(1, change().exitCode);
  } catch (const Lacking &why) {
    GTEST_SKIP() << "skipped: " << why.what();
  }
  EXPECT_EQ(content_, readFile(file_));
  EXPECT_EQ(0, change().exitCode);
  EXPECT_EQ(left(), std::set<std::string>{file_}) << "the next writer clears it";
}

TEST_F(HostileProtection, OfAFileInASessionIsNamedAndKeepsTheRest) {
  const std::string id = runCommand({"session", "create"}).out.substr(0, sizeof "sess.XXXXXX" - 1);
  const std::string file = std::string(kSessionRoot) + "/" + id + "/file";
  writeFile(file, "kept");
  try {
    const Protection protection(file, FS_IMMUTABLE_FL);
    const Outcome outcome = runCommand({"session", "destroy", id});
    EXPECT_EQ(1, outcome.exitCode);
    EXPECT_THAT(outcome.messages, HasSubstr(id + "/file: Operation not permitted")) << outcome;
  } catch (const Lacking &why) {
    GTEST_SKIP() << "skipped: " << why.what();
  }
  EXPECT_EQ("kept", readFile(file)) << "under its old id";
}

} // namespace
