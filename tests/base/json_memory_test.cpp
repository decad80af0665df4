// How failures of the JSON library leave a call: memory that ran out as everywhere else, any other
// failure unchanged.

#include "base/json_memory.h"

#include <gtest/gtest.h>
#include <json/value.h>

namespace {

using KOVA::Base::JsonMemory::withBadAlloc;

TEST(WithBadAlloc, ReturnsWhatTheCallReturns) {
  int number = 1;
  int &same = withBadAlloc([&]() -> int & { return number; });
  EXPECT_EQ(&number, &same);
}

TEST(WithBadAlloc, ThrowsBadAllocWhenMemoryRanOut) {
  const auto fail = [] { throw Json::RuntimeError("x: Failed to allocate string value buffer"); };
  EXPECT_THROW(withBadAlloc(fail), std::bad_alloc);
}

TEST(WithBadAlloc, PassesOnAnotherFailureOfTheLibrary) {
  const auto fail = [] { throw Json::RuntimeError("Exceeded stackLimit in readValue()."); };
  try {
    withBadAlloc(fail);
    ADD_FAILURE() << "nothing was thrown";
  } catch (const Json::RuntimeError &error) {
    EXPECT_STREQ("Exceeded stackLimit in readValue().", error.what());
  }
}

} // namespace
