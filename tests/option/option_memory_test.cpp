// Memory that runs out, also in the JSON library, which does not throw std::bad_alloc itself: each
// operation is done or throws std::bad_alloc, and what it was to change is as before.

#include "kovabackup/option_map.h"
#include "tests/option/fake_platform.h"
#include "tests/support/alloc_failure.h"
#include "tests/support/files.h"
#include "tests/support/log_capture.h"

#include <gtest/gtest.h>
#include <list>
#include <string>

using namespace KOVA::Backup;
using namespace KovaTest;

namespace {

const std::string kLong = "too long to be kept within a string object";
const std::string kOld = R"({"key":"old"})";

class OptionMemory : public PlatformTest {
protected:
  LogCapture log_;
  OptionMap map_;

  void SetUp() override {
    PlatformTest::SetUp();
    prepare();
  }

  void prepare() {
    map_ = OptionMap();
    map_.optSet("key", "old");
  }

  // Runs change(map) on a map with an old value, which must be as before on bad_alloc.
  template <typename Change>
  void expectDoneOrThrown(Change change) {
    bool threwOnce = false;
    std::string done;
    forEachMalloc([&] { change(map_); },
                  [&](bool threw) {
                    threwOnce = threwOnce || threw;
                    done = map_.optToJsonString();
                    EXPECT_EQ(threw, done == kOld) << done;
                    prepare();
                  });
    EXPECT_TRUE(threwOnce);
    EXPECT_NE(kOld, done);
  }
};

} // namespace

TEST_F(OptionMemory, RunsOutWhileATextIsSet) {
  expectDoneOrThrown([](OptionMap &map) { map.optSet("key", kLong); });
  expectDoneOrThrown([](OptionMap &map) { map.optSet("key", kLong.c_str()); });
  expectDoneOrThrown([](OptionMap &map) { map.optSet("key", kLong, true); });
}

TEST_F(OptionMemory, RunsOutWhileANewKeyIsSet) {
  expectDoneOrThrown([](OptionMap &map) { map.optSet(kLong, kLong); });
  expectDoneOrThrown([](OptionMap &map) { map.optSet(kLong, 1); });
  expectDoneOrThrown([](OptionMap &map) { map.optSet(kLong, true); });
}

TEST_F(OptionMemory, RunsOutWhileAListIsSet) {
  expectDoneOrThrown([](OptionMap &map) {
    map.optSet(kLong, std::list<std::string>{kLong, "short", kLong});
  });
}

TEST_F(OptionMemory, RunsOutWhileAMapIsCopied) {
  OptionMap original;
  original.optSet(kLong, kLong);
  original.optSet("list", std::list<std::string>{kLong, "short"});
  expectDoneOrThrown([&](OptionMap &map) { map = original; });
  expectDoneOrThrown([&](OptionMap &map) { original.optCloneTo(map); });
  expectDoneOrThrown([&](OptionMap &map) { OptionMap(original).optCloneTo(map); });
}

// The JSON library itself reads the text with a real.
TEST_F(OptionMemory, RunsOutWhileJsonIsRead) {
  for (const std::string &text :
       {R"({"a":[")" + kLong + R"("]})", R"({"a":["x\n)" + kLong + R"(",1.5]})"}) {
    expectDoneOrThrown([&](OptionMap &map) { EXPECT_TRUE(map.optLoadJsonString(text)); });
    expectDoneOrThrown([&](OptionMap &map) { EXPECT_TRUE(map.optAppendJsonString(text)); });
  }
}

TEST_F(OptionMemory, RunsOutWhileJsonIsWritten) {
  map_.optSet(kLong, std::list<std::string>{kLong, "short"});
  map_.optSet("list", std::list<std::string>{kLong, "short"});
  const std::string expected = map_.optToJsonString();
  std::string got;
  forEachMalloc(
      [&] {
        got.clear();
        got = map_.optToJsonString();
      },
      [&](bool threw) { EXPECT_EQ(threw ? "" : expected, got); });
}

// A failing malloc of the C library's streams is a file that cannot be opened, which is silent, or
// a read error, which is logged.
TEST_F(OptionMemory, RunsOutWhileASectionIsLoaded) {
  const TestFolder dir;
  const std::string path =
      writeFile(dir / "conf", "[task12]\n" + kLong + "=[\"" + kLong + "\"]\nother key=\"x\\n" +
                                  kLong + "\"\nreal=1.5\n");
  ASSERT_TRUE(map_.optSectionLoad(path, "task", 12));
  const std::string expected = map_.optToJsonString();
  forEachMalloc([&] { (void)map_.optSectionLoad(path, "task", 12); },
                [&](bool threw) {
                  EXPECT_TRUE(!threw || !map_.optIsLoaded());
                  EXPECT_EQ(map_.optIsLoaded() ? expected : "{}", map_.optToJsonString());
                  log_.take();
                });
  EXPECT_TRUE(map_.optIsLoaded());
}

TEST_F(OptionMemory, RunsOutWhileASectionIsExported) {
  const TestFolder dir;
  map_.optSet(kLong, kLong);
  map_.optSet("list", std::list<std::string>{kLong});
  forEachMalloc(
      [&] {
        platform.setCalls.clear();
        EXPECT_TRUE(map_.optSectionExport(dir / "conf", "task12", false));
      },
      [&](bool threw) { EXPECT_EQ(threw, platform.setCalls.empty()); });
}
