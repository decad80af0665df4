// Each system call of a walk fails once and from then on: what is given, reported and left open.

#include "kovabackup/service/tree_walk.h"

#include "tests/service/tree_walk_support.h"
#include "tests/support/counting_loop.h"
#include "tests/support/fault.h"

#include <algorithm>
#include <cerrno>
#include <fcntl.h>
#include <set>
#include <sys/stat.h>
#include <unistd.h>

using namespace KovaTest;
using KOVA::Backup::Service::Error;

namespace {

int readsAtOnce = 0; // 0: as many bytes as asked for

} // namespace

extern "C" ssize_t read(int fd, void *buffer, size_t size) {
  using Read = ssize_t(int, void *, size_t);
  const size_t most = readsAtOnce == 0 ? size : static_cast<size_t>(readsAtOnce);
  return failsNow("read") ? -1 : realFunction<Read>("read")(fd, buffer, std::min(size, most));
}

namespace {

namespace fs = std::filesystem;

struct Outcome {
  Paths fine;
  Paths failed;
  std::set<std::string> steps;
  std::set<int> codes;
};

Outcome walkOnce(const WalkOptions &options = {}) {
  Outcome given;
  for (const WalkEntry &entry : walkAll("/tmp/walk", options)) {
    if (entry.error.code == 0) {
      given.fine.push_back(entry.path);
      EXPECT_EQ("", entry.error.step);
      EXPECT_EQ("", entry.error.path);
      EXPECT_NE(0U, entry.inode);
      continue;
    }
    EXPECT_EQ(entry.path, entry.error.path);
    given.failed.push_back(entry.path);
    given.steps.insert(entry.error.step);
    given.codes.insert(entry.error.code);
  }
  return given;
}

constexpr const char *kFunctions[] = {"openat", "statx", "getdents64"};

// Calls operation(fault) with each call of the function failing in turn, alone.
template <typename Operation>
void forEachSingleFailure(const char *function, int code, Operation operation) {
  countFailures(function, Failing::Once, [&](int nth, bool) {
    const Fault fault(function, nth, code);
    operation(fault);
    return fault.fired();
  });
}

// Whether an entry is missing because of a failure of it or of a folder above it.
bool isExplained(const std::string &path, const Paths &failed) {
  return std::any_of(failed.begin(), failed.end(), [&path](const std::string &folder) {
    return path == folder || path.rfind(folder + "/", 0) == 0;
  });
}

class TreeWalkFailure : public TreeWalkTest {
protected:
  void SetUp() override {
    TreeWalkTest::SetUp();
    // Deep enough that folders are left by "..", with names due above.
    makeAll({"a/1", "a/2", "b/c/d/e/f/g/h/1", "b/c/d/2", "b/c/z", "b/z", "i/j/1", "k"});
    complete_ = walkOnce().fine;
    ASSERT_EQ(19U, complete_.size());
  }

  void expectFailures(const char *function, int code) const {
    forEachFailure(function, code, [&](Fault &fault) {
      const Outcome given = walkOnce();
      expectNothingElseMissing(given);
      EXPECT_EQ(fault.fired(), !given.failed.empty());
      if (fault.fired()) {
        EXPECT_EQ(std::set<std::string>{function}, given.steps);
        EXPECT_EQ(std::set<int>{code}, given.codes);
      }
    });
  }

  void expectNothingElseMissing(const Outcome &given) const {
    auto at = given.fine.begin();
    for (const std::string &path : complete_) {
      if (at != given.fine.end() && *at == path) {
        ++at;
      } else {
        EXPECT_TRUE(isExplained(path, given.failed)) << path;
      }
    }
    EXPECT_EQ(given.fine.end(), at) << *at << " is given out of order";
  }

  Paths complete_;
};

class TreeWalkCacheFailure : public TreeWalkTest {
protected:
  void SetUp() override {
    TreeWalkTest::SetUp();
    make("cache/CACHEDIR.TAG", "Signature: 8a477f597d28d172789f06886806bc55\n");
    options_.skipCaches = true;
  }
  void TearDown() override {
    readsAtOnce = 0;
    TreeWalkTest::TearDown();
  }

  WalkOptions options_;
};

} // namespace

TEST_F(TreeWalkFailure, ToOpenAFolderComesWithIt) {
  expectFailures("openat", EMFILE);
}

TEST_F(TreeWalkFailure, ToExamineAnEntryComesWithIt) {
  expectFailures("statx", EIO);
}

TEST_F(TreeWalkFailure, ToReadAFolderComesWithIt) {
  expectFailures("getdents64", EIO);
}

TEST_F(TreeWalkFailure, OfOneCallIsReportedOnce) {
  for (const char *function : kFunctions) {
    forEachSingleFailure(function, EIO, [](const Fault &fault) {
      const std::size_t reported = walkOnce().failed.size();
      EXPECT_EQ(fault.fired() ? 1U : 0U, reported);
    });
  }
}

TEST_F(TreeWalkFailure, BehindTheNamesOfAFolderLosesNoneOfThem) {
  const Fault fault("getdents64", 2, EIO); // the root's end
  const Outcome given = walkOnce();
  EXPECT_EQ(Paths{kRoot}, given.failed);
  EXPECT_EQ(complete_, given.fine);
}

TEST_F(TreeWalkFailure, OfTheWayUpLosesNothingWhenTheWayDownIsOpen) {
  int withoutLoss = 0;
  forEachSingleFailure("openat", EACCES, [&](const Fault &fault) {
    const Outcome given = walkOnce();
    withoutLoss += fault.fired() && given.fine == complete_ ? 1 : 0;
  });
  EXPECT_EQ(4, withoutLoss) << "e, d, c and b are left by \"..\"";
}

TEST_F(TreeWalkFailure, ThatTheEntryVanishedIsNotReported) {
  for (const char *function : kFunctions) {
    countFailures(function, Failing::Once, [&](int nth, bool) {
      const Fault fault(function, nth + 1, ENOENT); // the first of each is the root's
      EXPECT_EQ(Paths{}, walkOnce().failed);
      return fault.fired();
    });
  }
}

TEST_F(TreeWalkFailure, IsNotWhatASignalCauses) {
  for (const char *function : kFunctions) {
    forEachSingleFailure(function, EINTR,
                         [this](const Fault &) { EXPECT_EQ(complete_, pathsOf(walkAll(kRoot))); });
  }
}

TEST_F(TreeWalkFailure, ToReadALinkIsReturned) {
  fs::create_symlink("target", kRoot + "/a/0");
  PathFilter filter;
  TreeWalk walk(kRoot, filter);
  WalkEntry entry;
  ASSERT_TRUE(walk.next(entry) && walk.next(entry) && walk.next(entry));
  std::string target = "mine";
  Error error;
  {
    const Fault fault("readlinkat", 1, EIO);
    EXPECT_FALSE(walk.linkTarget(target, error));
  }
  EXPECT_EQ(EIO, error.code);
  EXPECT_EQ("readlinkat", error.step);
  EXPECT_EQ("/tmp/walk/a/0", error.path);
  EXPECT_EQ("mine", target);
  const Fault fault("readlinkat", 1, EINTR);
  EXPECT_TRUE(walk.linkTarget(target, error));
  EXPECT_EQ("target", target);
}

TEST_F(TreeWalkFailure, ToReadTheRootOfTheSystemNamesIt) {
  const Fault fault("getdents64", 1, EIO);
  PathFilter filter;
  TreeWalk walk("/", filter);
  WalkEntry entry;
  ASSERT_TRUE(walk.next(entry) && walk.next(entry));
  EXPECT_EQ("/", entry.path);
  EXPECT_EQ("/", entry.error.path);
  EXPECT_EQ(EIO, entry.error.code);
}

TEST_F(TreeWalkFailure, LeavesNoPatternAndNoLinkToTheFolderThatIsGivenAgain) {
  PathFilter filter;
  filter.addExcludePattern("**");
  filter.addIncludePattern("**");
  const Fault fault("getdents64", 1, EIO);
  TreeWalk walk(kRoot, filter);
  WalkEntry entry;
  ASSERT_TRUE(walk.next(entry) && walk.next(entry));
  ASSERT_EQ(EIO, entry.error.code);
  std::string text = "mine";
  Error error;
  EXPECT_FALSE(walk.decidedBy(text));
  EXPECT_FALSE(walk.linkTarget(text, error));
  EXPECT_EQ(EINVAL, error.code);
  EXPECT_EQ("mine", text);
  walk.skipFolder();
  EXPECT_FALSE(walk.next(entry));
}

TEST_F(TreeWalkCacheFailure, ReadsASignatureInPieces) {
  readsAtOnce = 1;
  EXPECT_EQ((Paths{"/tmp/walk", "/tmp/walk/cache"}), pathsOf(walkAll(kRoot, options_)));
}

TEST_F(TreeWalkCacheFailure, WalksAFolderWhoseTagCannotBeRead) {
  forEachFailure("read", EIO, [&](Fault &fault) {
    const std::size_t given = pathsOf(walkAll(kRoot, options_)).size();
    EXPECT_EQ(fault.fired() ? 3U : 2U, given);
  });
}

TEST_F(TreeWalkCacheFailure, IsNotWhatASignalCauses) {
  for (const char *function : {"openat", "statx", "read"}) {
    forEachSingleFailure(function, EINTR, [this](const Fault &) {
      EXPECT_EQ((Paths{"/tmp/walk", "/tmp/walk/cache"}), pathsOf(walkAll(kRoot, options_)));
    });
  }
}
