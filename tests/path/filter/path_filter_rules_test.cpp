// The page of rules is a promise to users: every row of its tables is checked against the library.

#include "kovabackup/path_filter.h"

#include "path/filter/path_filter_private.h"

#include <fstream>
#include <gmock/gmock.h>
#include <list>
#include <sstream>
#include <string>
#include <vector>

using namespace KOVA::Backup;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

using Row = std::vector<std::string>;

// A cell without surrounding white space and without the backquotes of code.
std::string cellText(const std::string &cell) {
  const std::size_t begin = cell.find_first_not_of(' ');
  if (begin == std::string::npos) {
    return "";
  }
  const std::string text = cell.substr(begin, cell.find_last_not_of(' ') - begin + 1);
  const bool code = text.size() > 1 && text.front() == '`' && text.back() == '`';
  return code ? text.substr(1, text.size() - 2) : text;
}

Row readRow(const std::string &line) {
  Row row;
  std::istringstream cells(line.substr(1));
  for (std::string cell; std::getline(cells, cell, '|');) {
    row.push_back(cellText(cell));
  }
  return row;
}

// The rows of the table under a heading, without its own heading rows.
std::vector<Row> tableUnder(const std::string &heading) {
  std::ifstream page(KOVA_RULES_PAGE);
  std::vector<Row> rows;
  bool here = false;
  for (std::string line; std::getline(page, line);) {
    if (line.rfind("## ", 0) == 0) {
      here = line == "## " + heading;
    } else if (here && line.rfind("|", 0) == 0) {
      rows.push_back(readRow(line));
    }
  }
  if (rows.size() < 2) {
    ADD_FAILURE() << "no table under \"" << heading << "\" in " << KOVA_RULES_PAGE;
    return {};
  }
  return {rows.begin() + 2, rows.end()};
}

std::list<std::string> words(const std::string &text) {
  std::istringstream in(text);
  std::list<std::string> all;
  for (std::string word; in >> word;) {
    all.push_back(word);
  }
  return all;
}

bool yes(const std::string &answer) {
  EXPECT_TRUE(answer == "yes" || answer == "no") << answer;
  return answer == "yes";
}

TEST(RulesPage, MatchTableHolds) {
  const std::vector<Row> rows = tableUnder("Does the pattern match the path?");
  EXPECT_LE(50U, rows.size());
  for (const Row &row : rows) {
    ASSERT_LE(3U, row.size());
    SCOPED_TRACE("| " + row[0] + " | " + row[1]);
    const bool expected = yes(row[2]);
    EXPECT_EQ(expected, PathFilterPrivate::match(row[0].c_str(), row[1].c_str()) == 1);
    PathFilter filter;
    filter.addExcludePattern(row[0]);
    EXPECT_EQ(expected, filter.filterOut(row[1]));
  }
}

TEST(RulesPage, FilterTableHolds) {
  const std::vector<Row> rows = tableUnder("Is the path left out?");
  EXPECT_LE(12U, rows.size());
  for (const Row &row : rows) {
    ASSERT_LE(4U, row.size());
    SCOPED_TRACE("| " + row[0] + " | " + row[1] + " | " + row[2]);
    PathFilter filter;
    for (const std::string &pattern : words(row[0])) {
      filter.addIncludePattern(pattern);
    }
    for (const std::string &pattern : words(row[1])) {
      filter.addExcludePattern(pattern);
    }
    EXPECT_EQ(yes(row[3]), filter.filterOut(row[2]));
  }
}

TEST(RulesPage, BaseTableHolds) {
  const std::vector<Row> rows = tableUnder("What of the pattern applies below a folder?");
  EXPECT_LE(19U, rows.size());
  for (const Row &row : rows) {
    ASSERT_LE(3U, row.size());
    SCOPED_TRACE("| " + row[0] + " | " + row[1]);
    PathFilter filter;
    filter.addIncludePattern(row[0]);
    filter.addExcludePattern(row[0]);
    std::list<std::string> includes;
    std::list<std::string> excludes;
    EXPECT_TRUE(filter.getIncludePattern(includes, row[1]));
    EXPECT_TRUE(filter.getExcludePattern(excludes, row[1]));
    if (row[2] == "-") {
      EXPECT_THAT(includes, IsEmpty());
    } else {
      EXPECT_THAT(includes, ElementsAre(row[2]));
    }
    EXPECT_EQ(includes, excludes);
  }
}

} // namespace
