// Each system call of a removal fails once and from then on: what is left, reported and answered.

#include "tests/service/tree_hooks.h"
#include "tests/service/tree_removal_support.h"
#include "tests/support/census.h"
#include "tests/support/child_process.h"
#include "tests/support/counting_loop.h"
#include "tests/support/files.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <csignal>
#include <memory>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

using namespace KovaTest;

namespace {

namespace fs = std::filesystem;

bool isBelow(const std::string &path, const std::string &folder) {
  return path.rfind(folder + "/", 0) == 0;
}

class TreeRemovalFailure : public TreeRemovalTest {
protected:
  void TearDown() override {
    withoutTypes = false;
    withoutMountIds = false;
    TreeRemovalTest::TearDown();
  }

  // Deeper than the removal has descriptors, with names that are due on the way back.
  static void makeTree() {
    makeAll({"a/1", "a/2", "b/c/d/e/f/g/h/i/j/k/l/m/1", "b/c/d/e/f/2/", "b/c/d/2/x", "b/c/z/",
             "b/z", "i/j/1", "k", "empty/"});
  }

  // Removes a tree while the faults are in force, and checks that the answer and the reports agree
  // with what is left.
  template <typename... Faults>
  static Outcome removeWith(bool &fired, const Faults &...faults) {
    fs::create_directory(kRoot);
    makeTree();
    Paths reported;
    Outcome outcome;
    {
      const std::array<std::unique_ptr<Fault>, sizeof...(faults)> inForce = {faults()...};
      outcome.gone = TreeRemoval::remove(kRoot, [&](const Error &error) {
        reported.push_back(error.path);
        outcome.failures.push_back(failure(error.step, error.path, error.code));
      });
      fired = inForce[0]->fired();
    }
    expectAgreement(outcome.gone, reported);
    return outcome;
  }

  static void expectAgreement(bool gone, const Paths &reported) {
    const Paths left = pathsIn(kRoot);
    EXPECT_EQ(gone, left.empty());
    for (const std::string &path : left) {
      EXPECT_TRUE(std::any_of(reported.begin(), reported.end(),
                              [&](const std::string &one) {
                                return one == path || one == "/tmp/" || isBelow(path, one) ||
                                       isBelow(one, path);
                              }))
          << path << " is left without a report";
    }
    for (const std::string &path : reported) {
      EXPECT_EQ(1, std::count(reported.begin(), reported.end(), path)) << path;
      EXPECT_TRUE(path == kRoot || path == "/tmp/" || isBelow(path, kRoot)) << path;
    }
  }

  // Removes a tree with each call of the function failing in turn.
  template <typename Check, typename... Others>
  static void forEachFault(const char *function, int code, Failing failing, Check check,
                           const Others &...others) {
    countFailures(function, failing, [&](int nth, bool lasting) {
      bool fired = false;
      const Outcome outcome = removeWith(
          fired, [&] { return std::make_unique<Fault>(function, nth, code, lasting); }, others...);
      check(outcome, fired);
      return fired;
    });
  }

  static void expectStep(const Outcome &outcome, const std::string &step, int code) {
    for (const std::string &one : outcome.failures) {
      EXPECT_EQ(0U, one.rfind(step + " /tmp/", 0)) << one;
      EXPECT_EQ(": " + std::to_string(code), one.substr(one.rfind(':'))) << one;
    }
  }

  static void expectReports(const char *function, int code) {
    forEachFault(function, code, Failing::OnceAndLasting, [&](const Outcome &outcome, bool fired) {
      EXPECT_EQ(fired, !(outcome == kGone));
      expectStep(outcome, function, code);
    });
  }

  static void expectOneReport(const char *function, const std::string &path, int code) {
    const Outcome expected = {false, {failure(function, path, code)}};
    forEachFault(function, code, Failing::OnceAndLasting, [&](const Outcome &outcome, bool fired) {
      EXPECT_EQ(outcome, fired ? expected : kGone);
    });
  }

  static std::unique_ptr<Fault> withoutOpenat2() {
    return std::make_unique<Fault>("openat2", 1, ENOSYS, true);
  }
};

} // namespace

TEST_F(TreeRemovalFailure, ToRemoveAnEntryIsReported) {
  expectReports("unlinkat", EACCES);
}

TEST_F(TreeRemovalFailure, ToReadAFolderIsReported) {
  expectReports("getdents64", EIO);
}

TEST_F(TreeRemovalFailure, ToCompareTheRootIsReported) {
  expectOneReport("statx", kRoot, EIO);
}

TEST_F(TreeRemovalFailure, ToOpenTheFolderAboveTheRootIsReported) {
  expectOneReport("openat", "/tmp/", EMFILE);
}

TEST_F(TreeRemovalFailure, ToOpenAFolderIsReportedUnlessItIsEmpty) {
  int withoutReport = 0;
  forEachFault("openat2", EMFILE, Failing::Once, [&](const Outcome &outcome, bool fired) {
    expectStep(outcome, "openat2", EMFILE);
    withoutReport += fired && outcome == kGone ? 1 : 0;
  });
  EXPECT_EQ(3 + 7, withoutReport) << "2, z and empty; the way back, which is tried again";
  forEachFault("openat2", EMFILE, Failing::OnceAndLasting,
               [&](const Outcome &outcome, bool) { expectStep(outcome, "openat2", EMFILE); });
}

TEST_F(TreeRemovalFailure, IsNotWhatASignalCauses) {
  for (const char *function : {"openat", "openat2", "statx", "getdents64", "unlinkat"}) {
    forEachFault(function, EINTR, Failing::Once,
                 [](const Outcome &outcome, bool) { EXPECT_EQ(kGone, outcome); });
  }
}

TEST_F(TreeRemovalFailure, ThatTheEntryVanishedIsNotReported) {
  for (const char *function : {"openat2", "getdents64", "unlinkat"}) {
    countFailures(function, Failing::Once, [&](int nth, bool) {
      fs::create_directory(kRoot);
      makeTree();
      Outcome outcome;
      bool fired = false;
      {
        const Fault fault(function, nth, ENOENT);
        outcome = removeTree(kRoot);
        fired = fault.fired();
      }
      // A call that fails without a reason is repeated when the folder above is not empty. Above
      // the root there is none.
      EXPECT_EQ(kGone, outcome);
      EXPECT_TRUE(pathsIn(kRoot).size() < 2 || (function == std::string("openat2") && nth == 1));
      return fired;
    });
  }
}

TEST_F(TreeRemovalFailure, OfAFolderThatIsNotEmptyIsTriedAgain) {
  for (const int code : {ENOTEMPTY, EEXIST}) {
    makeAll({"a/1", "b/c/2"});
    Outcome outcome;
    int reads = 0;
    {
      const Fault fault("unlinkat", 2, code); // the first is that of a file
      const Fault read("getdents64", 1000, EIO);
      outcome = removeTree(kRoot);
      reads = read.calls();
    }
    EXPECT_EQ(kGone, outcome);
    EXPECT_EQ(2 * 5, reads) << "four folders, one of them twice";
  }
}

TEST_F(TreeRemovalFailure, OfAFolderThatIsNeverEmptyIsReportedInTheEnd) {
  make("a/");
  int reads = 0;
  beforeCall = [&](const std::string &call, const char *name) {
    if (call == "openat2" && name == std::string("a")) {
      ++reads;
    }
    if (call == "unlinkat" && name == std::string("a")) {
      make("a/new" + std::to_string(reads));
    }
  };
  const Outcome outcome = removeTree(kRoot);
  beforeCall = nullptr;
  EXPECT_EQ((Outcome{false, {failure("unlinkat", kRoot + "/a", ENOTEMPTY)}}), outcome);
  EXPECT_EQ(32, reads);
  EXPECT_EQ((Paths{kRoot, kRoot + "/a", kRoot + "/a/new32"}), pathsIn(kRoot));
}

TEST_F(TreeRemovalFailure, OfOneCallWithoutOpenat2IsReported) {
  for (const char *function : {"openat", "statx"}) {
    forEachFault(
        function, EMFILE, Failing::OnceAndLasting,
        [&](const Outcome &outcome, bool fired) {
          expectStep(outcome, function, EMFILE);
          EXPECT_TRUE(fired || outcome == kGone);
        },
        withoutOpenat2);
  }
}

TEST_F(TreeRemovalFailure, IsNotWhatASignalCausesWithoutOpenat2) {
  for (const char *function : {"openat", "statx"}) {
    forEachFault(
        function, EINTR, Failing::Once,
        [](const Outcome &outcome, bool) { EXPECT_EQ(kGone, outcome); }, withoutOpenat2);
  }
}

TEST_F(TreeRemovalFailure, OfOpenat2AloneIsNoFailure) {
  for (const int code : {ENOSYS, EPERM}) {
    forEachFault("openat2", code, Failing::OnceAndLasting,
                 [](const Outcome &outcome, bool) { EXPECT_EQ(kGone, outcome); });
  }
}

TEST_F(TreeRemovalFailure, OfOpenat2IsRemembered) {
  makeTree();
  const Fault refused("openat2", 1, EPERM, true);
  EXPECT_EQ(kGone, removeTree(kRoot));
  EXPECT_EQ(1, refused.calls());
}

TEST_F(TreeRemovalFailure, ToTellMountsApartLeavesTheTree) {
  const Fault refused("openat2", 1, ENOSYS, true);
  withoutMountIds = true;
  make("a");
  EXPECT_EQ((Outcome{false, {failure("statx", kRoot, ENOSYS)}}), removeTree(kRoot));
  EXPECT_EQ((Paths{kRoot, kRoot + "/a"}), pathsIn(kRoot));
  EXPECT_EQ(kGone, removeTree(kRoot + "/a")) << "no folder";
}

TEST_F(TreeRemovalFailure, IsNotThatTheFileSystemGivesNoTypes) {
  withoutTypes = true;
  makeTree();
  fs::create_directory_symlink("/tmp", kRoot + "/a/link");
  ASSERT_EQ(0, ::mkfifo((kRoot + "/a/fifo").c_str(), 0600));
  EXPECT_EQ(kGone, removeTree(kRoot));
  expectReports("getdents64", EIO);
  forEachFault("unlinkat", EACCES, Failing::OnceAndLasting,
               [](const Outcome &outcome, bool) { expectStep(outcome, "unlinkat", EACCES); });
}

TEST_F(TreeRemovalFailure, ToUnlinkWhatTurnsOutToBeAFolderIsNone) {
  withoutTypes = true;
  make("a/1");
  const Fault fault("unlinkat", 1, EACCES); // what a folder gets that may not be written to
  EXPECT_EQ(kGone, removeTree(kRoot));
}

TEST_F(TreeRemovalFailure, ToRemoveAFileOfUnknownTypeIsReportedOnce) {
  withoutTypes = true;
  make("a");
  const Fault fault("unlinkat", 1, EROFS, true);
  EXPECT_EQ(
      (Outcome{false,
               {failure("unlinkat", kRoot + "/a", EROFS), failure("unlinkat", kRoot, EROFS)}}),
      removeTree(kRoot));
}

TEST_F(TreeRemovalFailure, EndsWhereTenDescriptorsAreFree) {
  int few = 0;
  for (int free = 0; free <= 10; ++free) {
    SCOPED_TRACE(std::to_string(free) + " free");
    EXPECT_EQ(0, runInChild([&] {
                makeTree();
                const auto most = static_cast<rlim_t>(countOpenDescriptors() + free);
                const rlimit limit = {most, most};
                rlimit before = {};
                ::getrlimit(RLIMIT_NOFILE, &before);
                if (::setrlimit(RLIMIT_NOFILE, &limit) != 0) {
                  return 2;
                }
                const Outcome outcome = removeTree(kRoot);
                return outcome.gone == outcome.failures.empty() ? 0 : 1;
              }));
    const bool gone = !isThere(kRoot);
    few += gone ? 0 : 1;
    EXPECT_TRUE(gone || free < 10);
    fs::create_directory(kRoot);
  }
  EXPECT_LT(2, few);
}

TEST_F(TreeRemovalFailure, IsNotThatARemovalBeforeWasKilled) {
  make("/tmp/outside/kept");
  bool killed = true;
  for (int nth = 1; killed; ++nth) {
    SCOPED_TRACE("killed before call " + std::to_string(nth));
    fs::create_directory(kRoot);
    makeTree();
    fs::create_directory_symlink(kOutside, kRoot + "/b/c/link");
    killed = runInChild([&] {
               beforeCall = [calls = 0, nth](const std::string &, const char *) mutable {
                 if (++calls == nth) {
                   (void)::kill(::getpid(), SIGKILL);
                 }
               };
               return removeTree(kRoot) == kGone ? 0 : 1;
             }) == -1;
    EXPECT_TRUE(killed || nth > 50);
    EXPECT_EQ(killed, isThere(kRoot));
    EXPECT_EQ(kGone, removeTree(kRoot));
    ASSERT_TRUE(isThere(kOutside + "/kept"));
  }
}
