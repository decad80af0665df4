// How the stand-ins record a failure, and which calls do not compile.

#include "platform/support/failure.h"

#include <cerrno>
#include <gtest/gtest.h>
#include <new>
#include <string>
#include <type_traits>

using namespace KovaPlatform;

namespace {

constexpr const char *kFile = "here.cpp";

struct CallFail {
  template <typename... Arguments>
  auto operator()(Arguments... arguments) const -> decltype(fail(arguments...)) {
    return fail(arguments...);
  }
};

struct CallGuarded {
  template <typename... Arguments>
  auto operator()(Arguments... arguments) const -> decltype(guarded(arguments...)) {
    return guarded(arguments...);
  }
};

using Body = int (*)();

// Without these, the checks below would also pass for a function that cannot be called at all.
static_assert(std::is_invocable_r_v<int, CallFail, Failure>);
static_assert(std::is_invocable_r_v<bool, CallFail, Failure, bool>);
static_assert(std::is_invocable_r_v<int, CallGuarded, Failure, int, Body>);
static_assert(std::is_constructible_v<Failure, int, const char *>);

// Code, file, line and result cannot be mistaken for each other, in whatever order they are passed.
static_assert(!std::is_invocable_v<CallFail, int, const char *>);
static_assert(!std::is_invocable_v<CallFail, int, const char *, int>);
static_assert(!std::is_invocable_v<CallFail, int, const char *, int, int>);
static_assert(!std::is_invocable_v<CallFail, int, Failure>);
static_assert(!std::is_invocable_v<CallFail, Failure, int, int>);
static_assert(!std::is_constructible_v<Failure, const char *, int>);
static_assert(!std::is_constructible_v<Failure, int, const char *, int>);
static_assert(!std::is_convertible_v<int, Failure>);
static_assert(!std::is_convertible_v<int, SourceLine>);
static_assert(!std::is_invocable_v<CallGuarded, int, Failure, Body>);
static_assert(!std::is_invocable_v<CallGuarded, const char *, int, Body>);
static_assert(!std::is_invocable_v<CallGuarded, int, const char *, Body>);

struct Record {
  int code;
  std::string file;
  int line;
};

Record record() {
  return {KLIBCErrGet(), KLIBCErrorGetFile(), KLIBCErrorGetLine()};
}

} // namespace

TEST(Failure, IsRecordedWithTheLineOfTheCall) {
  const int result = fail({7, kFile});
  const int line = __LINE__ - 1;
  EXPECT_EQ(-1, result);
  EXPECT_EQ(7, record().code);
  EXPECT_EQ("here.cpp", record().file);
  EXPECT_EQ(line, record().line);
}

TEST(Failure, GivesTheResultThatItsCallerIsToSee) {
  EXPECT_EQ(0, fail({7, kFile}, 0));
  EXPECT_FALSE(fail({7, kFile}, false));
  EXPECT_EQ(nullptr, fail({7, kFile}, nullptr));
}

TEST(Failure, LeavesErrnoAlone) {
  errno = ELOOP;
  (void)fail({7, kFile});
  EXPECT_EQ(ELOOP, errno);
}

TEST(Guarded, GivesTheResultOfItsBody) {
  (void)fail({1, "before.cpp"});
  EXPECT_EQ(5, guarded({7, kFile}, -1, [] { return 5; }));
  EXPECT_EQ("before.cpp", record().file);
}

TEST(Guarded, RecordsWhatIsThrownWithItsOwnLine) {
  const auto body = []() -> int { throw std::bad_alloc(); };
  const int result = guarded({7, kFile}, -3, body);
  const int line = __LINE__ - 1;
  EXPECT_EQ(-3, result);
  EXPECT_EQ(7, record().code);
  EXPECT_EQ("here.cpp", record().file);
  EXPECT_EQ(line, record().line);
}

TEST(Guarded, LetsNothingOutThatIsNotAnException) {
  const auto body = []() -> const char * { throw 1; };
  EXPECT_EQ(nullptr, guarded({7, kFile}, nullptr, body));
  EXPECT_EQ(7, record().code);
}
