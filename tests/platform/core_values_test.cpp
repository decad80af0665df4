// The error record, the string list, the string hash and fork. The contents of a hash can only be
// seen in the sections that are written from it; core_section_text_test looks at those.

#include "tests/platform/core_support.h"
#include "tests/support/fault.h"

#include <cerrno>
#include <climits>
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

using namespace KovaTest;

TEST(ErrorRecord, IsEachThreadsOwn) {
  KLIBCErrSetEx(0x1234, "here.c", 5);
  std::thread([] {
    EXPECT_EQ(0, KLIBCErrGet());
    EXPECT_STREQ("", KLIBCErrorGetFile());
    EXPECT_EQ(0, KLIBCErrorGetLine());
    KLIBCErrSetEx(0x4321, "there.c", 6);
  }).join();
  EXPECT_EQ(0x1234, KLIBCErrGet());
  EXPECT_STREQ("here.c", KLIBCErrorGetFile());
  EXPECT_EQ(5, KLIBCErrorGetLine());
}

TEST(ErrorRecord, TakesNoFileAndItsOwn) {
  KLIBCErrSetEx(1, "file.c", 2);
  KLIBCErrSetEx(3, KLIBCErrorGetFile(), 4);
  EXPECT_STREQ("file.c", KLIBCErrorGetFile());
  KLIBCErrSetEx(-5, nullptr, -6);
  EXPECT_EQ(-5, KLIBCErrGet());
  EXPECT_STREQ("", KLIBCErrorGetFile());
  EXPECT_EQ(-6, KLIBCErrorGetLine());
}

TEST(ErrorRecord, CutsALongFile) {
  KLIBCErrSetEx(1, std::string(300, 'x').c_str(), 2);
  EXPECT_EQ(std::string(255, 'x'), KLIBCErrorGetFile());
  KLIBCErrSetEx(1, "short", 2);
  EXPECT_STREQ("short", KLIBCErrorGetFile());
}

TEST(SzList, IsEmptyAndHasTheCapacityAskedFor) {
  for (const int capacity : {0, 1, 1024}) {
    KLIBCSzList *list = KLIBCSzListAlloc(capacity);
    ASSERT_NE(nullptr, list);
    EXPECT_EQ(0, list->count);
    EXPECT_EQ(capacity, list->capacity);
    KLIBCSzListFree(list);
  }
}

TEST(SzList, ShowsItsCountAsTheSecondInteger) {
  KLIBCSzList *list = KLIBCSzListAlloc(3);
  ASSERT_NE(nullptr, list);
  EXPECT_EQ(0, reinterpret_cast<const int32_t *>(list)[1]);
  KLIBCSzListFree(list);
}

TEST(SzList, RefusesANegativeCapacity) {
  for (const int capacity : {-1, INT_MIN}) {
    clearError();
    EXPECT_EQ(nullptr, KLIBCSzListAlloc(capacity));
    EXPECT_EQ(KLIBC_ERR_BAD_PARAMETER, errorCode());
  }
}

TEST(SzList, GivesNullOutsideItsCount) {
  KLIBCSzList *list = KLIBCSzListAlloc(8);
  for (const int index : {0, 7, -1, INT_MAX, INT_MIN}) {
    clearError();
    EXPECT_EQ(nullptr, KLIBCSzListGet(list, index)) << index;
    EXPECT_EQ(KLIBC_ERR_BAD_PARAMETER, errorCode()) << index;
  }
  KLIBCSzListFree(list);
  clearError();
  EXPECT_EQ(nullptr, KLIBCSzListGet(nullptr, 0));
  EXPECT_EQ(KLIBC_ERR_BAD_PARAMETER, errorCode());
}

TEST(SzList, FreesNull) {
  clearError();
  KLIBCSzListFree(nullptr);
  EXPECT_EQ(0, errorCode());
}

TEST(SzHash, TakesAnyCapacityThatIsNotNegative) {
  for (const int capacity : {0, 1, 1024, INT_MAX}) {
    KLIBCSzHash *hash = KLIBCSzHashAlloc(capacity);
    EXPECT_NE(nullptr, hash) << capacity;
    KLIBCSzHashFree(hash);
  }
  for (const int capacity : {-1, INT_MIN}) {
    clearError();
    EXPECT_EQ(nullptr, KLIBCSzHashAlloc(capacity));
    EXPECT_EQ(KLIBC_ERR_BAD_PARAMETER, errorCode());
  }
}

TEST(SzHash, FreesNull) {
  clearError();
  KLIBCSzHashFree(nullptr);
  EXPECT_EQ(0, errorCode());
}

TEST(SzHash, TakesMorePairsThanItsCapacity) {
  KLIBCSzHash *hash = KLIBCSzHashAlloc(1);
  clearError();
  for (int i = 0; i < 5000; ++i) {
    ASSERT_LE(0, KLIBCSzHashSetValue(&hash, ("key" + std::to_string(i)).c_str(), "1"));
  }
  EXPECT_EQ(0, errorCode());
  KLIBCSzHashFree(hash);
}

TEST(SzHash, RefusesNullArguments) {
  KLIBCSzHash *hash = KLIBCSzHashAlloc(1);
  KLIBCSzHash *none = nullptr;
  const auto refuses = [](KLIBCSzHash **handle, const char *key, const char *value) {
    clearError();
    return KLIBCSzHashSetValue(handle, key, value) < 0 && errorCode() == KLIBC_ERR_BAD_PARAMETER;
  };
  EXPECT_TRUE(refuses(nullptr, "key", "1"));
  EXPECT_TRUE(refuses(&none, "key", "1"));
  EXPECT_TRUE(refuses(&hash, nullptr, "1"));
  EXPECT_TRUE(refuses(&hash, "key", nullptr));
  KLIBCSzHashFree(hash);
}

struct Acceptance {
  const char *text;
  int code;
};

TEST(SzHash, RefusesAKeyThatCouldNotBeReadBack) {
  const Acceptance table[] = {
      {"key", 0},
      {"a b", 0},
      {"a\tb", 0},
      {"\xc3\xa9t\xc3\xa9 \xff", 0},
      {"\vkey\f", 0}, // vertical tab and form feed are not white space
      {"a#b", 0},
      {"a[b]", 0},
      {"]", 0},
      {";", 0},
      {"", KLIBC_ERR_BAD_KEY},
      {" ", KLIBC_ERR_BAD_KEY},
      {" key", KLIBC_ERR_BAD_KEY},
      {"key ", KLIBC_ERR_BAD_KEY},
      {"\tkey", KLIBC_ERR_BAD_KEY},
      {"key\t", KLIBC_ERR_BAD_KEY},
      {"\nkey", KLIBC_ERR_BAD_KEY},
      {"key\r", KLIBC_ERR_BAD_KEY},
      {"ke\ny", KLIBC_ERR_BAD_KEY},
      {"ke\ry", KLIBC_ERR_BAD_KEY},
      {"x\n[other]\nkey", KLIBC_ERR_BAD_KEY},
      {"=", KLIBC_ERR_BAD_KEY},
      {"a=b", KLIBC_ERR_BAD_KEY},
      {"key=", KLIBC_ERR_BAD_KEY},
      {"#key", KLIBC_ERR_BAD_KEY},
      {"[key", KLIBC_ERR_BAD_KEY},
      {"[key]", KLIBC_ERR_BAD_KEY},
  };
  for (const Acceptance &row : table) {
    KLIBCSzHash *hash = KLIBCSzHashAlloc(4);
    clearError();
    EXPECT_EQ(row.code == 0, KLIBCSzHashSetValue(&hash, row.text, "1") >= 0) << row.text;
    EXPECT_EQ(row.code, errorCode()) << row.text;
    KLIBCSzHashFree(hash);
  }
}

TEST(SzHash, RefusesAValueThatWouldLeaveItsLine) {
  const Acceptance table[] = {
      {"1", 0},
      {"", 0},
      {"\"a = # [b] \\n\"", 0},
      {" 1 ", 0},
      {"\n", KLIBC_ERR_BAD_VALUE},
      {"1\n", KLIBC_ERR_BAD_VALUE},
      {"1\r", KLIBC_ERR_BAD_VALUE},
      {"1\r2", KLIBC_ERR_BAD_VALUE},
      {"1\n[other]\nkey=2", KLIBC_ERR_BAD_VALUE},
  };
  for (const Acceptance &row : table) {
    KLIBCSzHash *hash = KLIBCSzHashAlloc(4);
    clearError();
    EXPECT_EQ(row.code == 0, KLIBCSzHashSetValue(&hash, "key", row.text) >= 0) << row.text;
    EXPECT_EQ(row.code, errorCode()) << row.text;
    KLIBCSzHashFree(hash);
  }
}

TEST(ProcFork, ReturnsZeroInTheChildAndItsPidInTheParent) {
  clearError();
  const pid_t pid = KLIBCProcFork();
  if (pid == 0) {
    ::_exit(23);
  }
  ASSERT_LT(0, pid);
  int status = 0;
  EXPECT_EQ(pid, ::waitpid(pid, &status, 0));
  EXPECT_TRUE(WIFEXITED(status));
  EXPECT_EQ(23, WEXITSTATUS(status));
  EXPECT_EQ(0, errorCode());
}

TEST(ProcFork, IsNegativeAndKeepsErrnoOnFailure) {
  const Fault fault("fork", 1, EAGAIN);
  clearError();
  errno = 0;
  EXPECT_GT(0, KLIBCProcFork());
  EXPECT_EQ(EAGAIN, errno);
  EXPECT_EQ(KLIBC_ERR_FORK, errorCode());
}
