// A block of a document can fail.

#include "tests/docs/snippet_fixture.h"

#include <gtest/gtest-spi.h>
#include <stdexcept>

namespace {

class SnippetFixture : public KovaTest::SnippetTest {};

bool ends() {
  return true;
}

bool gaveUp() {
  return false;
}

TEST_F(SnippetFixture, LetsABlockPassThatReachesItsEnd) {
  run(ends, {});
}

TEST_F(SnippetFixture, FailsABlockThatGivesUp) {
  EXPECT_NONFATAL_FAILURE(run(gaveUp, {}), "the block returned false");
}

TEST_F(SnippetFixture, FailsABlockWithoutThePromisedLogLine) {
  EXPECT_NONFATAL_FAILURE(run(ends, {"session:174 invalid parameter"}), "session:174");
}

TEST_F(SnippetFixture, EndsABlockAtAClaimThatDoesNotHold) {
  EXPECT_THROW(KovaTest::snippetFailed("1 == 2", 7), std::runtime_error);
}

} // namespace
