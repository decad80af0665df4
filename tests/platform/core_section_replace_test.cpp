// How the section-file services replace a file: which files they accept, what they preserve, and
// what remains when a system call fails. core_section_text_test covers the text itself.

#include "tests/platform/core_support.h"
#include "tests/support/child_process.h"
#include "tests/support/lease.h"

#include <cerrno>
#include <climits>
#include <cstring>
#include <fcntl.h>
#include <filesystem>
#include <functional>
#include <gmock/gmock.h>
#include <grp.h>
#include <sys/file.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/xattr.h>
#include <unistd.h>

using namespace KovaTest;
using testing::ElementsAre;
using testing::UnorderedElementsAre;

namespace {

const std::string kOld = "# top\n[s]\nk=0\n[t]\nz=1\n";
const std::string kNew = "# top\n[s]\nk=1\n[t]\nz=1\n";
constexpr const char *kSlot = ".kovacore.0.tmp";

std::size_t mostWritten = SIZE_MAX;      // bytes that one write accepts
bool linksEverywhere = false;            // every name is a link to itself
std::function<void()> beforeLookingAtIt; // runs before the name is looked up again
std::function<void()> beforeLocking;     // runs before each flock

int setK(const std::string &path) {
  return setSection(path, "s", {{"k", "1"}});
}

int enumerate(const std::string &path) {
  KLIBCSzList *list = KLIBCSzListAlloc(1);
  const int result = KLIBCFileEnumSection(path.c_str(), &list);
  EXPECT_TRUE(result >= 0 || list->count == 0);
  KLIBCSzListFree(list);
  return result;
}

// Calls all four services on a path that they refuse and expects the code from each.
void expectRefused(const std::string &path, int code) {
  clearError();
  EXPECT_GT(0, enumerate(path));
  EXPECT_EQ(code, errorCode());
  clearError();
  EXPECT_GT(0, setK(path));
  EXPECT_EQ(code, errorCode());
  clearError();
  EXPECT_GT(0, addSection(path, "u", {{"k", "1"}}));
  EXPECT_EQ(code, errorCode());
  clearError();
  EXPECT_GT(0, removeSection(path, "s"));
  EXPECT_EQ(code, errorCode());
}

struct stat statusOf(const std::string &path) {
  struct stat status {};
  EXPECT_EQ(0, ::stat(path.c_str(), &status)) << path;
  return status;
}

// Runs the body in a child with another user's rights. Returns its result, up to 255.
int asUser(uid_t uid, gid_t gid, const std::function<int()> &body) {
  return runInChild([&] {
    const bool changed = ::setgroups(0, nullptr) == 0 && ::setgid(gid) == 0 && ::setuid(uid) == 0;
    return changed ? body() : 255;
  });
}

// The last byte of an error code, which is all that a child can report.
int exitCode() {
  return errorCode() & 0xff;
}

bool mayGiveFilesAway(const std::string &path) {
  return ::chown(path.c_str(), 1234, 2345) == 0;
}

} // namespace

extern "C" ssize_t write(int fd, const void *buf, size_t size) {
  static auto *const real = realFunction<ssize_t(int, const void *, size_t)>("write");
  return failsNow("write") ? -1 : real(fd, buf, std::min(size, mostWritten));
}

extern "C" int fstatat(int dir, const char *path, struct stat *out, int flags) noexcept {
  static auto *const real = realFunction<int(int, const char *, struct stat *, int)>("fstatat");
  if (beforeLookingAtIt) {
    beforeLookingAtIt();
  }
  return failsNow("fstatat") ? -1 : real(dir, path, out, flags);
}

extern "C" ssize_t readlinkat(int dir, const char *path, char *buf, size_t size) noexcept {
  static auto *const real = realFunction<ssize_t(int, const char *, char *, size_t)>("readlinkat");
  if (linksEverywhere) {
    std::memcpy(buf, path, std::strlen(path));
    return static_cast<ssize_t>(std::strlen(path));
  }
  return failsNow("readlinkat") ? -1 : real(dir, path, buf, size);
}

extern "C" int flock(int fd, int operation) noexcept {
  static auto *const real = realFunction<int(int, int)>("flock");
  if (beforeLocking) {
    beforeLocking();
  }
  return failsNow("flock") ? -1 : real(fd, operation);
}

TEST(SectionFile, IsMissing) {
  const TestFolder dir;
  expectRefused(dir / "conf", KLIBC_ERR_NO_FILE);
  expectRefused(dir / "no/conf", KLIBC_ERR_NO_FILE);
  expectRefused("", KLIBC_ERR_NO_FILE);
  ASSERT_EQ(0, ::symlink("nowhere", (dir / "link").c_str()));
  expectRefused(dir / "link", KLIBC_ERR_NO_FILE);
  EXPECT_THAT(dir.names(), ElementsAre("link"));
}

TEST(SectionFile, IsNoRegularFile) {
  const TestFolder dir;
  expectRefused(dir / "", KLIBC_ERR_NOT_REGULAR);
  expectRefused("/dev/null", KLIBC_ERR_NOT_REGULAR);
  ASSERT_EQ(0, ::mkfifo((dir / "fifo").c_str(), 0600)); // without a writer: must not hang
  expectRefused(dir / "fifo", KLIBC_ERR_NOT_REGULAR);
  const int server = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  struct sockaddr_un address = {AF_UNIX, {}};
  std::strcpy(address.sun_path, (dir / "socket").c_str());
  ASSERT_EQ(0, ::bind(server, reinterpret_cast<struct sockaddr *>(&address), sizeof address));
  expectRefused(dir / "socket", KLIBC_ERR_NOT_REGULAR);
  ::close(server);
  EXPECT_THAT(dir.names(), ElementsAre("fifo", "socket"));
}

TEST(SectionFile, CannotBeOpened) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  expectRefused(dir / "conf/", KLIBC_ERR_OPEN);
  expectRefused(dir / "conf/x", KLIBC_ERR_OPEN);
  ASSERT_EQ(0, ::symlink("loop", (dir / "loop").c_str()));
  expectRefused(dir / "loop", KLIBC_ERR_OPEN);
  expectRefused(dir / std::string(300, 'x'), KLIBC_ERR_OPEN);
}

TEST(SectionFile, IsOpenedWhenALeaseOnItIsGivenUp) {
  const TestFolder dir;
  for (const bool change : {false, true}) {
    writeFile(dir / "conf", kOld);
    LeaseHolder holder(dir / "conf");
    if (!holder.held()) {
      GTEST_SKIP() << "skipped: no leases on this file system";
    }
    clearError();
    EXPECT_LE(0, change ? setK(dir / "conf") : enumerate(dir / "conf"));
    EXPECT_EQ(0, errorCode());
    EXPECT_TRUE(holder.wasAsked());
  }
  EXPECT_EQ(kNew, readFile(dir / "conf"));
}

TEST(SectionFile, IsAnotherFileAfterEachChange) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  ASSERT_EQ(0, ::link((dir / "conf").c_str(), (dir / "other name").c_str()));
  EXPECT_EQ(1, setK(dir / "conf"));
  EXPECT_EQ(kNew, readFile(dir / "conf"));
  EXPECT_EQ(kOld, readFile(dir / "other name")) << "it was written in place";
  EXPECT_THAT(dir.names(), ElementsAre("conf", "other name"));
}

TEST(SectionFile, IsFoundFromTheWorkingDirectory) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  const std::string before = std::filesystem::current_path();
  ASSERT_EQ(0, ::chdir((dir / "").c_str()));
  EXPECT_EQ(1, setK("conf"));
  EXPECT_EQ(0, ::chdir(before.c_str()));
  EXPECT_EQ(kNew, readFile(dir / "conf"));
}

TEST(SectionFile, IsReplacedAtTheEndOfAllLinks) {
  const TestFolder dir;
  std::filesystem::create_directories(dir / "a/b");
  std::filesystem::create_directories(dir / "c");
  writeFile(dir / "c/conf", kOld);
  const std::vector<std::pair<std::string, std::string>> links = {{dir / "c/conf", "a/absolute"},
                                                                  {"../../c/conf", "a/b/up"},
                                                                  {"b/up", "a/down"},
                                                                  {"a/down", "first"},
                                                                  {dir / "a/b", "folder"},
                                                                  {"folder/up", "through"}};
  for (const auto &[target, name] : links) {
    ASSERT_EQ(0, ::symlink(target.c_str(), (dir / name).c_str()));
  }
  for (const char *name : {"a/absolute", "a/b/up", "a/down", "first", "folder/up", "through"}) {
    writeFile(dir / "c/conf", kOld);
    EXPECT_EQ(1, setK(dir / name)) << name;
    EXPECT_EQ(kNew, readFile(dir / "c/conf")) << name;
  }
  for (const auto &[target, name] : links) {
    EXPECT_EQ(target, std::filesystem::read_symlink(dir / name));
  }
  EXPECT_THAT(dir.names(), ElementsAre("a", "c", "first", "folder", "through"));
  EXPECT_EQ(1, std::distance(std::filesystem::directory_iterator(dir / "c"), {}));
}

// As many links as the kernel follows.
TEST(SectionFile, IsReplacedAtTheEndOfFortyLinks) {
  const TestFolder dir;
  writeFile(dir / "0", kOld);
  for (int link = 1; link <= 41; ++link) {
    const std::string path = dir / std::to_string(link);
    ASSERT_EQ(0, ::symlink(std::to_string(link - 1).c_str(), path.c_str()));
  }
  EXPECT_EQ(1, setK(dir / "40"));
  EXPECT_EQ(kNew, readFile(dir / "0"));
  expectRefused(dir / "41", KLIBC_ERR_OPEN);
}

TEST(SectionFile, IsNotSoughtForEverWhenLinksAreSwappedIn) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  clearError();
  linksEverywhere = true;
  EXPECT_GT(0, setK(dir / "conf"));
  linksEverywhere = false;
  EXPECT_EQ(ELOOP, errno);
  EXPECT_EQ(KLIBC_ERR_OPEN, errorCode());
  EXPECT_EQ(kOld, readFile(dir / "conf"));
}

TEST(SectionFile, MayHoldMoreThanItsSizeSays) {
  EXPECT_EQ(0U, statusOf("/proc/self/maps").st_size);
  clearError();
  EXPECT_LE(0, enumerate("/proc/self/maps"));
  EXPECT_EQ(0, errorCode());
}

TEST(SectionFile, KeepsItsMode) {
  const TestFolder dir;
  for (const int mode : {0644, 0600, 0664, 0666, 0777, 0640, 0200 | 0400, 06755}) {
    writeFile(dir / "conf", kOld);
    ASSERT_EQ(0, ::chmod((dir / "conf").c_str(), static_cast<mode_t>(mode)));
    EXPECT_EQ(1, setK(dir / "conf"));
    EXPECT_EQ(mode, modeOf(dir / "conf"));
  }
}

// A file system with one mode for all files may refuse to set even that one.
TEST(SectionFile, GetsNoModeThatItHas) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  ASSERT_EQ(0, ::chmod((dir / "conf").c_str(), 0600));
  const Fault fault("fchmod", 1, EPERM);
  EXPECT_EQ(1, setK(dir / "conf"));
  EXPECT_FALSE(fault.fired());
}

TEST(SectionFile, KeepsItsOwnerAndGroup) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  if (!mayGiveFilesAway(dir / "conf")) {
    GTEST_SKIP() << "skipped: only root may give files away";
  }
  ASSERT_EQ(0, ::chmod((dir / "conf").c_str(), 06750)); // bits that a change of owner would clear
  EXPECT_EQ(1, setK(dir / "conf"));
  EXPECT_EQ(kNew, readFile(dir / "conf"));
  EXPECT_EQ(1234U, statusOf(dir / "conf").st_uid);
  EXPECT_EQ(2345U, statusOf(dir / "conf").st_gid);
  EXPECT_EQ(06750, modeOf(dir / "conf"));
}

TEST(SectionFile, KeepsItsExtendedAttributes) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  const std::string large(3000, 'x');
  if (::setxattr((dir / "conf").c_str(), "user.large", large.data(), large.size(), 0) != 0) {
    GTEST_SKIP() << "skipped: no user attributes here: " << std::strerror(errno);
  }
  ASSERT_EQ(0, ::setxattr((dir / "conf").c_str(), "user.empty", "", 0, 0));
  EXPECT_EQ(1, setK(dir / "conf"));
  EXPECT_EQ(kNew, readFile(dir / "conf"));
  std::string value(4096, '\0');
  EXPECT_EQ(3000, ::getxattr((dir / "conf").c_str(), "user.large", value.data(), value.size()));
  EXPECT_EQ(large, value.substr(0, 3000));
  EXPECT_EQ(0, ::getxattr((dir / "conf").c_str(), "user.empty", value.data(), value.size()));
}

// The kernel's measurement of the old content would make the new content look tampered with.
TEST(SectionFile, KeepsNoMeasurementOfItsContent) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  for (const char *name : {"security.ima", "security.evm"}) {
    if (::setxattr((dir / "conf").c_str(), name, "measure", 7, 0) != 0) {
      GTEST_SKIP() << "skipped: " << name << " cannot be set: " << std::strerror(errno);
    }
  }
  EXPECT_EQ(1, setK(dir / "conf"));
  for (const char *name : {"security.ima", "security.evm"}) {
    EXPECT_EQ(-1, ::getxattr((dir / "conf").c_str(), name, nullptr, 0)) << name;
  }
}

namespace {

// An access control list as the kernel keeps it: owner rw, user 4321 rw, group r, mask rw, other -.
const unsigned char kAccessList[] = {2,  0, 0, 0,                        // version
                                     1,  0, 6, 0, 255,  255,  255, 255,  // owner
                                     2,  0, 6, 0, 0xe1, 0x10, 0,   0,    // user 4321
                                     4,  0, 4, 0, 255,  255,  255, 255,  // group
                                     16, 0, 6, 0, 255,  255,  255, 255,  // mask
                                     32, 0, 0, 0, 255,  255,  255, 255}; // other

std::string accessList(const std::string &path) {
  std::string value(256, '\0');
  const ssize_t size =
      ::getxattr(path.c_str(), "system.posix_acl_access", value.data(), value.size());
  return size < 0 ? "none" : value.substr(0, static_cast<std::size_t>(size));
}

bool putAccessList(const std::string &path, const char *name) {
  return ::setxattr(path.c_str(), name, kAccessList, sizeof kAccessList, 0) == 0;
}

} // namespace

TEST(SectionFile, KeepsItsAccessList) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  if (!putAccessList(dir / "conf", "system.posix_acl_access")) {
    GTEST_SKIP() << "skipped: no access control lists here: " << std::strerror(errno);
  }
  const std::string before = accessList(dir / "conf");
  ASSERT_NE("none", before);
  EXPECT_EQ(1, setK(dir / "conf"));
  EXPECT_EQ(before, accessList(dir / "conf"));
  EXPECT_EQ(0660, modeOf(dir / "conf"));
}

TEST(SectionFile, GetsNoAccessListFromItsDirectory) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  ASSERT_EQ(0, ::chmod((dir / "conf").c_str(), 0640));
  if (!putAccessList(dir / "", "system.posix_acl_default")) {
    GTEST_SKIP() << "skipped: no access control lists here: " << std::strerror(errno);
  }
  clearError();
  {
    const Fault fault("fremovexattr", 1, EIO); // must not pass: others could read the new file
    EXPECT_GT(0, setK(dir / "conf"));
    EXPECT_EQ(KLIBC_ERR_ATTRIBUTES, errorCode());
    EXPECT_EQ(kOld, readFile(dir / "conf"));
  }
  EXPECT_EQ(1, setK(dir / "conf"));
  EXPECT_EQ(kNew, readFile(dir / "conf"));
  EXPECT_EQ("none", accessList(dir / "conf"));
  EXPECT_EQ(0640, modeOf(dir / "conf"));
}

// Only the system may set some attributes, and it has already set them on the new file.
TEST(SectionFile, GetsNoAttributeThatItHas) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  if (!putAccessList(dir / "", "system.posix_acl_default") ||
      !putAccessList(dir / "conf", "system.posix_acl_access")) {
    GTEST_SKIP() << "skipped: no access control lists here: " << std::strerror(errno);
  }
  const std::string before = accessList(dir / "conf");
  const Fault fault("fsetxattr", 1, EPERM, true);
  EXPECT_EQ(1, setK(dir / "conf"));
  EXPECT_EQ(0, fault.calls());
  EXPECT_EQ(before, accessList(dir / "conf"));
}

// A user who may write the file and the directory may still not give the new file to the old owner.
// Without an error the file would silently become the writer's.
TEST(SectionFile, IsLeftToItsOwner) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  if (!mayGiveFilesAway(dir / "conf")) {
    GTEST_SKIP() << "skipped: only root may give files away";
  }
  ASSERT_EQ(0, ::chmod((dir / "conf").c_str(), 0666));
  ASSERT_EQ(0, ::chmod((dir / "").c_str(), 0777));
  EXPECT_EQ(KLIBC_ERR_ATTRIBUTES & 0xff, asUser(4321, 2345, [&] {
              return setK(dir / "conf") < 0 && errno == EPERM ? exitCode() : 254;
            }));
  EXPECT_EQ(kOld, readFile(dir / "conf"));
  EXPECT_THAT(dir.names(), ElementsAre("conf"));
  // Its owner, who is a member of its group, may change the file.
  EXPECT_EQ(1, asUser(1234, 2345, [&] { return setK(dir / "conf"); }));
  EXPECT_EQ(kNew, readFile(dir / "conf"));
  EXPECT_EQ(2345U, statusOf(dir / "conf").st_gid);
}

TEST(SectionFile, IsChangedByThoseOnlyWhoMayWriteIt) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  if (!mayGiveFilesAway(dir / "conf") || ::chown((dir / "").c_str(), 1234, 2345) != 0) {
    GTEST_SKIP() << "skipped: only root may give files away";
  }
  const auto change = [&] { return setK(dir / "conf") < 0 ? exitCode() : 254; };
  ASSERT_EQ(0, ::chmod((dir / "conf").c_str(), 0444));
  EXPECT_EQ(KLIBC_ERR_OPEN & 0xff, asUser(1234, 2345, change));
  ASSERT_EQ(0, ::chmod((dir / "conf").c_str(), 0644));
  ASSERT_EQ(0, ::chmod((dir / "").c_str(), 0555));
  EXPECT_EQ(KLIBC_ERR_CREATE & 0xff, asUser(1234, 2345, change));
  EXPECT_EQ(kOld, readFile(dir / "conf"));
  EXPECT_THAT(dir.names(), ElementsAre("conf"));
}

TEST(SectionFile, IsWrittenWholeByShortWrites) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  mostWritten = 1;
  EXPECT_EQ(1, setK(dir / "conf"));
  mostWritten = SIZE_MAX;
  EXPECT_EQ(kNew, readFile(dir / "conf"));
}

TEST(SectionFile, IsLeftAloneWhenNothingCanBeWritten) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  clearError();
  mostWritten = 0; // a write that neither accepts a byte nor fails must not repeat for ever
  EXPECT_GT(0, setK(dir / "conf"));
  mostWritten = SIZE_MAX;
  EXPECT_EQ(KLIBC_ERR_WRITE, errorCode());
  EXPECT_EQ(kOld, readFile(dir / "conf"));
}

TEST(SectionFile, IsChangedThoughASignalInterrupts) {
  for (const char *function : {"open", "openat", "read", "write"}) {
    const TestFolder dir;
    writeFile(dir / "conf", kOld);
    clearError();
    const Fault fault(function, 1, EINTR);
    EXPECT_EQ(1, setK(dir / "conf")) << function;
    EXPECT_TRUE(fault.fired()) << function;
    EXPECT_EQ(0, errorCode()) << function;
    EXPECT_EQ(kNew, readFile(dir / "conf")) << function;
  }
}

namespace {

// One change of each kind, and the resulting file.
struct Change {
  int (*make)(const std::string &path);
  std::string result;
};

const Change kSet = {setK, kNew};
const Change kAdd = {[](const std::string &path) {
                       return addSection(path, "u", {{"k", "1"}});
                     },
                     kOld + "[u]\nk=1\n"};
const Change kRemove = {[](const std::string &path) { return removeSection(path, "s"); },
                        "# top\n[t]\nz=1\n"};

// A change while a call fails. The file is reached through a link and has an attribute and an owner
// of its own, so that every call is made.
template <const Change &change, bool unnamedFiles>
struct Attempt {
  Attempt() {
    writeFile(dir / "conf", kOld);
    EXPECT_EQ(0, ::symlink("conf", (dir / "link").c_str()));
    EXPECT_EQ(0, ::chmod((dir / "conf").c_str(), 0640));
    (void)::setxattr((dir / "conf").c_str(), "user.test", "1", 1, 0);
    (void)mayGiveFilesAway(dir / "conf");
  }

  void run() {
    const Fault noTmpfile("O_TMPFILE", unnamedFiles ? INT_MAX : 1, EOPNOTSUPP, true);
    errno = 0;
    result = change.make(dir / "link");
    error = errno;
  }

  void check(bool fired) {
    const bool done = result == 1;
    EXPECT_EQ(!done, errorCode() != 0);
    EXPECT_TRUE(done || result < 0) << result;
    EXPECT_TRUE(done || fired) << "failed by itself";
    EXPECT_TRUE(done || error != 0);
    const bool inPlace = done || errorCode() == KLIBC_ERR_DIR_SYNC;
    EXPECT_EQ(inPlace ? change.result : kOld, readFile(dir / "conf"));
    EXPECT_EQ(0640, modeOf(dir / "conf"));
    // Only a failing removal leaves something, and the next writer clears that.
    leftovers = dir.names().size() - 2;
    EXPECT_EQ(1, setSection(dir / "conf", "t", {}));
    EXPECT_THAT(dir.names(), ElementsAre("conf", "link"));
  }

  TestFolder dir;
  int result = 0;
  int error = 0;
  std::size_t leftovers = 0;
};

template <typename Base>
struct Clean : Base {
  void check(bool fired) {
    Base::check(fired);
    EXPECT_EQ(0U, this->leftovers);
  }
};

template <const Change &change, bool unnamedFiles>
void failEverything() {
  using Scenario = Clean<Attempt<change, unnamedFiles>>;
  for (const char *function : {"open", "openat", "fstat", "read", "readlinkat", "fstatat", "write",
                               "fchmod", "flistxattr", "fgetxattr", "fsync", "renameat"}) {
    SCOPED_TRACE(function);
    failEachCall<Scenario>(function, EIO);
  }
  failEachCall<Scenario>("flock", ENOLCK);
}

} // namespace

TEST(SectionFile, IsWholeWhateverFails) {
  {
    SCOPED_TRACE("set");
    failEverything<kSet, true>();
  }
  {
    SCOPED_TRACE("add");
    failEverything<kAdd, true>();
  }
  {
    SCOPED_TRACE("remove");
    failEverything<kRemove, true>();
  }
  {
    SCOPED_TRACE("set without unnamed files");
    failEverything<kSet, false>();
  }
  {
    SCOPED_TRACE("add without unnamed files");
    failEverything<kAdd, false>();
  }
  failEachCall<Clean<Attempt<kSet, true>>>("linkat", EIO);
}

TEST(SectionFile, IsWholeWhenAttributesCannotBeKept) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  if (!mayGiveFilesAway(dir / "conf") ||
      ::setxattr((dir / "conf").c_str(), "user.test", "1", 1, 0) != 0) {
    GTEST_SKIP() << "skipped: no owners or attributes to keep";
  }
  for (const char *function : {"fchown", "fsetxattr"}) {
    SCOPED_TRACE(function);
    failEachCall<Clean<Attempt<kSet, true>>>(function, EPERM);
  }
}

// The code and errno by which a caller knows what failed, and how often fsync is tried.
TEST(SectionFile, SaysWhatFailed) {
  const struct {
    const char *function;
    int nth;
    int code;
  } table[] = {
      {"open", 1, KLIBC_ERR_OPEN},         {"fstat", 1, KLIBC_ERR_OPEN},
      {"read", 1, KLIBC_ERR_READ},         {"readlinkat", 1, KLIBC_ERR_OPEN},
      {"fstatat", 1, KLIBC_ERR_OPEN},      {"write", 1, KLIBC_ERR_WRITE},
      {"fchmod", 1, KLIBC_ERR_ATTRIBUTES}, {"flistxattr", 1, KLIBC_ERR_ATTRIBUTES},
      {"fsync", 1, KLIBC_ERR_SYNC},        {"renameat", 1, KLIBC_ERR_RENAME},
      {"fsync", 2, KLIBC_ERR_DIR_SYNC},
  };
  for (const auto &row : table) {
    const TestFolder dir;
    writeFile(dir / "conf", kOld);
    clearError();
    const Fault fault(row.function, row.nth, EDQUOT);
    EXPECT_GT(0, setK(dir / "conf")) << row.function;
    EXPECT_EQ(EDQUOT, errno) << row.function;
    EXPECT_EQ(row.code, errorCode()) << row.function;
    EXPECT_EQ(row.nth, fault.calls()) << row.function << " was tried again";
    EXPECT_EQ(row.code == KLIBC_ERR_DIR_SYNC ? kNew : kOld, readFile(dir / "conf"));
  }
}

TEST(SectionFile, IsChangedWhereDirectoriesCannotBeSynced) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  clearError();
  const Fault fault("fsync", 2, EINVAL);
  EXPECT_EQ(1, setK(dir / "conf"));
  EXPECT_TRUE(fault.fired());
  EXPECT_EQ(0, errorCode());
}

TEST(SectionFile, CannotBeReplacedWithoutAnyWayToMakeAFile) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  clearError();
  const Fault fault("openat", 3, EROFS, true); // the first two find the directory
  EXPECT_GT(0, setK(dir / "conf"));
  EXPECT_EQ(KLIBC_ERR_CREATE, errorCode());
  EXPECT_EQ(EROFS, errno);
  EXPECT_EQ(kOld, readFile(dir / "conf"));
}

TEST(SectionFile, IsSyncedBeforeItHasItsName) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  const Fault sync("fsync", INT_MAX, EIO);
  const Fault rename("renameat", 1, EIO);
  EXPECT_GT(0, setK(dir / "conf"));
  EXPECT_EQ(1, sync.calls());
}

// Without privilege, older kernels offer no other way to link an unnamed file, and without /proc
// they offer none at all.
TEST(SectionFile, IsReplacedByOtherWaysWhereLinkingFails) {
  for (const int failing : {1, 2}) {
    const TestFolder dir;
    writeFile(dir / "conf", kOld);
    clearError();
    const Fault first("linkat", 1, ENOENT);
    const Fault second("linkat", failing, ENOENT);
    EXPECT_EQ(1, setK(dir / "conf"));
    EXPECT_TRUE(first.fired() && second.fired());
    EXPECT_EQ(0, errorCode());
    EXPECT_EQ(kNew, readFile(dir / "conf"));
    EXPECT_THAT(dir.names(), ElementsAre("conf"));
  }
}

TEST(SectionFile, IsReadAgainWhenAnotherWriterReplacedIt) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  writeFile(dir / "next", "[s]\n[x]\n");
  beforeLookingAtIt = [&] {
    beforeLookingAtIt = nullptr;
    EXPECT_EQ(0, ::rename((dir / "next").c_str(), (dir / "conf").c_str()));
  };
  clearError();
  EXPECT_EQ(1, setK(dir / "conf"));
  EXPECT_EQ(0, errorCode());
  EXPECT_EQ("[s]\nk=1\n[x]\n", readFile(dir / "conf"));
}

TEST(SectionFile, IsGivenUpWhenItNeverComesToRest) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  int count = 0;
  beforeLookingAtIt = [&] {
    writeFile(dir / "next", kOld + "# " + std::to_string(++count) + "\n");
    EXPECT_EQ(0, ::rename((dir / "next").c_str(), (dir / "conf").c_str()));
  };
  clearError();
  EXPECT_GT(0, setK(dir / "conf"));
  beforeLookingAtIt = nullptr;
  EXPECT_EQ(KLIBC_ERR_BUSY, errorCode());
  EXPECT_LT(1, count);
  EXPECT_EQ(kOld + "# " + std::to_string(count) + "\n", readFile(dir / "conf"));
  EXPECT_THAT(dir.names(), ElementsAre("conf"));
}

// Otherwise a link that is swapped in a shared directory would redirect the change to another file.
TEST(SectionFile, IsNotReplacedBehindALinkThatWasSwappedIn) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  writeFile(dir / "victim", "[s]\nvictim=1\n");
  beforeLookingAtIt = [&] {
    beforeLookingAtIt = nullptr;
    EXPECT_EQ(0, ::unlink((dir / "conf").c_str()));
    EXPECT_EQ(0, ::symlink("missing", (dir / "conf").c_str()));
  };
  clearError();
  EXPECT_GT(0, setK(dir / "conf"));
  EXPECT_EQ(KLIBC_ERR_NO_FILE, errorCode());
  EXPECT_EQ("[s]\nvictim=1\n", readFile(dir / "victim"));
}

TEST(SectionLeftover, IsClearedByTheNextWriter) {
  const TestFolder dir;
  for (const bool unnamedFiles : {true, false}) {
    writeFile(dir / "conf", kOld);
    writeFile(dir / kSlot, "half a fi");
    writeFile(dir / ".kovacore.15.tmp", "");
    const Fault fault("O_TMPFILE", unnamedFiles ? INT_MAX : 1, EOPNOTSUPP, true);
    EXPECT_EQ(1, setK(dir / "conf"));
    EXPECT_EQ(kNew, readFile(dir / "conf"));
    EXPECT_THAT(dir.names(), ElementsAre("conf"));
  }
}

TEST(SectionLeftover, IsWhatAWriterCannotRemoveItself) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  {
    const Fault rename("renameat", 1, EIO);
    const Fault removal("unlinkat", 1, EPERM);
    errno = 0;
    EXPECT_GT(0, setK(dir / "conf"));
    EXPECT_EQ(EIO, errno) << "the reason is that of the first failure";
    EXPECT_TRUE(removal.fired());
  }
  EXPECT_THAT(dir.names(), ElementsAre(kSlot, "conf"));
  EXPECT_EQ(1, setK(dir / "conf"));
  EXPECT_THAT(dir.names(), ElementsAre("conf"));
}

TEST(SectionLeftover, IsNoneWhileItsMakerLives) {
  const TestFolder dir;
  for (const bool unnamedFiles : {true, false}) {
    writeFile(dir / "conf", kOld);
    writeFile(dir / kSlot, "at work");
    const int maker = ::open((dir / kSlot).c_str(), O_RDWR | O_CLOEXEC);
    ASSERT_EQ(0, ::flock(maker, LOCK_EX));
    const Fault fault("O_TMPFILE", unnamedFiles ? INT_MAX : 1, EOPNOTSUPP, true);
    EXPECT_EQ(1, setK(dir / "conf"));
    EXPECT_EQ(kNew, readFile(dir / "conf"));
    EXPECT_EQ("at work", readFile(dir / kSlot));
    EXPECT_THAT(dir.names(), ElementsAre(kSlot, "conf"));
    ::close(maker);
  }
}

TEST(SectionLeftover, IsNotWhatMerelyHasItsName) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  writeFile(dir / "other", "other");
  writeFile(dir / ".kovacore.16.tmp", "no slot");
  ASSERT_EQ(0, ::symlink("other", (dir / kSlot).c_str()));
  ASSERT_EQ(0, ::mkfifo((dir / ".kovacore.1.tmp").c_str(), 0600));
  ASSERT_EQ(0, ::mkdir((dir / ".kovacore.2.tmp").c_str(), 0700));
  const std::set<std::string> before = dir.names();
  EXPECT_EQ(1, setK(dir / "conf"));
  EXPECT_EQ(kNew, readFile(dir / "conf"));
  EXPECT_EQ(before, dir.names());
}

TEST(SectionLeftover, LeavesNoSlotWhenAllAreTaken) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  for (int slot = 0; slot < 16; ++slot) {
    ASSERT_EQ(0, ::mkdir((dir / (".kovacore." + std::to_string(slot) + ".tmp")).c_str(), 0700));
  }
  clearError();
  EXPECT_GT(0, setK(dir / "conf"));
  EXPECT_EQ(KLIBC_ERR_CREATE, errorCode());
  EXPECT_EQ(EBUSY, errno);
  EXPECT_EQ(kOld, readFile(dir / "conf"));
  EXPECT_EQ(17U, dir.names().size());
}

// Another writer takes the new file for a leftover before it is locked.
TEST(SectionLeftover, IsGivenUpByAMakerWhoLostItToTheNextWriter) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  writeFile(dir / ".kovacore.1.tmp", "");
  const Fault noTmpfile("O_TMPFILE", 1, EOPNOTSUPP, true);
  // The first lock is that of the leftover in slot 1, the second one the writer's own.
  const Fault fault("flock", 2, EWOULDBLOCK);
  EXPECT_EQ(1, setK(dir / "conf"));
  EXPECT_TRUE(fault.fired());
  EXPECT_EQ(kNew, readFile(dir / "conf"));
  EXPECT_THAT(dir.names(), ElementsAre(kSlot, "conf")); // left for the other writer to remove
}

// The other writer removes the file before it is locked.
TEST(SectionLeftover, IsMadeAnewByAMakerWhoseNameIsGone) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  const Fault noTmpfile("O_TMPFILE", 1, EOPNOTSUPP, true);
  int locks = 0;
  beforeLocking = [&] { EXPECT_EQ(++locks == 1 ? 0 : -1, ::unlink((dir / kSlot).c_str())); };
  EXPECT_EQ(1, setK(dir / "conf"));
  beforeLocking = nullptr;
  EXPECT_EQ(2, locks);
  EXPECT_EQ(kNew, readFile(dir / "conf"));
  EXPECT_THAT(dir.names(), ElementsAre("conf"));
}

// When the leftover is locked, its name already belongs to the file of a living writer.
TEST(SectionLeftover, IsNotWhatHasTakenItsName) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  writeFile(dir / kSlot, "left");
  writeFile(dir / "new", "at work");
  beforeLocking = [&] {
    beforeLocking = nullptr;
    EXPECT_EQ(0, ::rename((dir / "new").c_str(), (dir / kSlot).c_str()));
  };
  EXPECT_EQ(1, setK(dir / "conf"));
  EXPECT_EQ(kNew, readFile(dir / "conf"));
  EXPECT_EQ("at work", readFile(dir / kSlot));
}

TEST(SectionFile, KeepsEveryDescriptorFromChildren) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  beforeLookingAtIt = [&] {
    for (const auto &entry : std::filesystem::directory_iterator("/proc/self/fd")) {
      const int fd = std::stoi(entry.path().filename());
      std::error_code gone;
      const std::string what = std::filesystem::read_symlink(entry.path(), gone);
      if (what.rfind(dir.path(), 0) == 0) {
        EXPECT_EQ(FD_CLOEXEC, ::fcntl(fd, F_GETFD)) << what;
      }
    }
  };
  EXPECT_EQ(1, setK(dir / "conf"));
  beforeLookingAtIt = nullptr;
}
