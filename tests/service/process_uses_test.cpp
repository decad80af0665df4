// What is made of a process whose folder in /proc cannot be examined. The only process that these
// tests show is their own.

#include "service/process_uses.h"
#include "tests/service/session_hooks.h"

#include "tests/service/replaced_files.h"
#include "tests/support/fault.h"
#include "tests/support/files.h"

#include <cerrno>
#include <gtest/gtest.h>
#include <string>
#include <unistd.h>

using namespace KOVA::Backup::Service;
using namespace KovaTest;

namespace {

constexpr uid_t kOwner = 4711;
constexpr uid_t kOther = 4712;

class ClosedProcess : public testing::Test {
protected:
  ~ClosedProcess() override { replacedFiles().clear(); }

  /// From here on, a file of the process has this text.
  void replace(const std::string &name, const std::string &text) {
    replacedFiles()["/proc/" + std::to_string(::getpid()) + "/" + name] =
        writeFile(folder_ / name, text);
  }

  /// Looks at the processes while the list of the threads cannot be opened.
  void lookWithout(int code) {
    const Fault fault("opendir", 2, code); // the first is /proc
    EXPECT_TRUE(uses_.look(error_)) << error_.step;
    EXPECT_TRUE(fault.fired());
  }

  const TestFolder folder_;
  const OnlyProcesses only_;
  ProcessUses uses_;
  Error error_;
};

} // namespace

TEST_F(ClosedProcess, MattersToWhatBelongsToOneOfItsUsers) {
  replace("status", "Name:\tx\nUid:\t1\t2\t3\t4711\nGid:\t0\t0\t0\t0\n");
  lookWithout(EACCES);
  EXPECT_FALSE(uses_.isKnown(kOwner, error_));
  EXPECT_EQ(EACCES, error_.code);
  EXPECT_EQ("opendir", error_.step);
  EXPECT_TRUE(uses_.isKnown(kOther, error_));
}

TEST_F(ClosedProcess, MattersToEverythingWithoutKnownUsers) {
  for (const char *status : {"", "Name:\tx\n", "Name:\tx\nUid:\t1\tx\t1\t1\n"}) {
    replace("status", status);
    lookWithout(EPERM);
    EXPECT_FALSE(uses_.isKnown(kOther, error_)) << status;
  }
}

TEST_F(ClosedProcess, DoesNotMatterInAnotherUserNamespace) {
  replace("status", "Name:\tx\nUid:\t4711\t4711\t4711\t4711\n");
  replace("uid_map", "0 100000 65536\n");
  lookWithout(EACCES);
  EXPECT_TRUE(uses_.isKnown(kOwner, error_));
}

TEST_F(ClosedProcess, DoesNotMatterOnceItHasEnded) {
  const Fault fault("open", 1, ESRCH); // of its status
  lookWithout(EACCES);
  EXPECT_TRUE(fault.fired());
  EXPECT_TRUE(uses_.isKnown(kOther, error_));
}

TEST_F(ClosedProcess, MattersToEverythingForAnotherReason) {
  lookWithout(EMFILE);
  EXPECT_FALSE(uses_.isKnown(kOther, error_));
  EXPECT_EQ(EMFILE, error_.code);
}

TEST_F(ClosedProcess, IsOneWithAPathThatCanBeNeitherReadNorExamined) {
  const Fault unread("readlink", 4, ENAMETOOLONG); // of /proc/self, mnt, root and cwd
  const Fault unknown("stat", 1, EIO);
  EXPECT_TRUE(uses_.look(error_));
  EXPECT_FALSE(uses_.isKnown(kOther, error_));
  EXPECT_EQ(EIO, error_.code);
  EXPECT_EQ("stat", error_.step);
}

TEST_F(ClosedProcess, IsNotAProcessThatHasEndedMeanwhile) {
  const Fault unread("readlink", 4, ENAMETOOLONG);
  const Fault unknown("stat", 1, ENOENT);
  EXPECT_TRUE(uses_.look(error_));
  EXPECT_TRUE(uses_.isKnown(kOther, error_));
}

TEST_F(ClosedProcess, IsNoneInAnotherProc) {
  const Fault fault("readlink", 1, ENOENT); // of /proc/self
  EXPECT_FALSE(uses_.look(error_));
  EXPECT_EQ("/proc/self", error_.path);
}
