// Many threads query one filter while no thread changes it. Under the thread sanitizer this shows
// that a query writes nothing.

#include "kovabackup/path_filter.h"

#include "tests/path/filter/path_filter_tree.h"

#include <atomic>
#include <gtest/gtest.h>
#include <list>
#include <string>
#include <thread>
#include <vector>

using namespace KOVA::Backup;
namespace Tree = KovaTest::Tree;

namespace {

TEST(PathFilterThreads, AskingOneFilterFromManyThreadsGivesTheAnswersOfOneThread) {
  constexpr std::size_t kThreads = 8;
  constexpr int kPatterns = 500;
  PathFilter filter;
  std::list<std::string> merged;
  for (int i = 0; i < kPatterns; ++i) {
    merged.push_back(Tree::pattern(i));
  }
  filter.addExcludePattern(merged);
  filter.addExcludePattern("**a?b**");
  filter.addIncludePattern("**/semver/**");

  const std::vector<std::string> paths = Tree::paths();
  std::vector<char> expected;
  for (const std::string &path : paths) {
    expected.push_back(filter.filterOut(path) ? 1 : 0);
  }

  std::atomic<std::size_t> ready{0};
  std::vector<std::size_t> wrong(kThreads);
  std::vector<std::thread> threads;
  for (std::size_t number = 0; number < kThreads; ++number) {
    threads.emplace_back([&, number] {
      for (++ready; ready < kThreads;) {
        std::this_thread::yield();
      }
      for (std::size_t i = 0; i < paths.size(); ++i) {
        const std::size_t at = (i + number * paths.size() / kThreads) % paths.size();
        wrong[number] += filter.filterOut(paths[at]) == (expected[at] != 0) ? 0U : 1U;
      }
      std::list<std::string> out;
      filter.getExcludePattern(out, "/volume1/homes/user01");
      wrong[number] += out.empty() ? 1U : 0U;
    });
  }
  for (std::thread &thread : threads) {
    thread.join();
  }
  EXPECT_EQ(std::vector<std::size_t>(kThreads), wrong);
}

} // namespace
