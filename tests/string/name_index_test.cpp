// The index of names: what it finds, what it knows to be absent, and the names that it leaves out.

#include "string/name_index.h"

#include <gtest/gtest.h>
#include <string>
#include <vector>

namespace {

using Index = KOVA::Backup::NameIndex<int>;

// What a container without that name would return.
int searched(std::string_view /*name*/) {
  return -1;
}

// Names of every length, so that every way of reading their bytes occurs.
std::vector<std::string> makeNames(std::size_t count) {
  std::vector<std::string> names = {""};
  for (std::size_t i = 1; i < count; ++i) {
    names.push_back(std::string(i % 40, 'n') + std::to_string(i));
  }
  return names;
}

Index makeIndex(const std::vector<std::string> &names, std::size_t room) {
  Index index(room);
  for (std::size_t i = 0; i < names.size(); ++i) {
    index.add(names[i], static_cast<int>(i) + 1);
  }
  return index;
}

TEST(NameIndex, FindsEveryNameThatHasRoom) {
  const std::vector<std::string> names = makeNames(6);
  const Index index = makeIndex(names, names.size());
  for (std::size_t i = 0; i < names.size(); ++i) {
    EXPECT_EQ(static_cast<int>(i) + 1, index.find(names[i], &searched)) << names[i];
  }
}

TEST(NameIndex, FindsOrSearchesForEachOfManyNames) {
  const std::vector<std::string> names = makeNames(2000);
  const Index index = makeIndex(names, names.size());
  int left = 0;
  for (std::size_t i = 0; i < names.size(); ++i) {
    const int found = index.find(names[i], &searched);
    left += found == -1 ? 1 : 0;
    ASSERT_TRUE(found == static_cast<int>(i) + 1 || found == -1) << names[i] << ": " << found;
  }
  EXPECT_LT(left, 200);
}

TEST(NameIndex, KnowsThatNamesAreAbsent) {
  const std::vector<std::string> names = {"task", "", std::string("a\0", 2)};
  const Index index = makeIndex(names, names.size());
  for (const std::string &name : {std::string("Task"), std::string("tas"), std::string("task "),
                                  std::string("a"), std::string(1, '\0'), std::string(60, 'x')}) {
    EXPECT_EQ(0, index.find(name, &searched)) << name;
  }
  EXPECT_EQ(0, Index(0).find("", &searched));
}

TEST(NameIndex, SearchesForNamesThatItHadToLeaveOut) {
  const std::vector<std::string> names = makeNames(20);
  const Index index = makeIndex(names, 1); // room for two
  EXPECT_EQ(1, index.find(names[0], &searched));
  EXPECT_EQ(2, index.find(names[1], &searched));
  for (std::size_t i = 2; i < names.size(); ++i) {
    EXPECT_EQ(-1, index.find(names[i], &searched)) << names[i];
  }
}

} // namespace
