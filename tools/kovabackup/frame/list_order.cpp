#include "tools/kovabackup/frame/list_order.h"

#include "tools/kovabackup/frame/text.h"

#include <algorithm>
#include <cstdint>
#include <fmt/format.h>

namespace KOVA::Backup::Tool {
namespace {

std::string namesOf(const SortKeys &keys) {
  std::string names;
  for (std::size_t i = 0; i < keys.size(); ++i) {
    names += (i == 0 ? "" : i + 1 == keys.size() ? " or " : ", ") + keys[i].first;
  }
  return names;
}

std::vector<Candidate> candidatesOf(const SortKeys &keys) {
  std::vector<Candidate> words;
  for (const auto &[name, member] : keys) {
    words.push_back({name, "smallest first"});
    words.push_back({"-" + name, "largest first"});
  }
  return words;
}

std::string memberOf(const std::string &key, const SortKeys &keys) {
  for (const auto &[name, member] : keys) {
    if (name == key) {
      return member;
    }
  }
  throw Failure(kUsage, fmt::format("'{}' is not a sort key: use {}, with - before it for the "
                                    "reverse order",
                                    key, namesOf(keys)));
}

} // namespace

void declareOrder(Command &command, OrderOptions &options, const SortKeys &keys) {
  command
      .option(options.sort, "--sort", "KEY",
              fmt::format("sort by {}; -KEY reverses the order", namesOf(keys)))
      .completes([keys](const std::vector<std::string> &) { return candidatesOf(keys); })
      .option(options.limit, "--limit", "N", "list only the first N");
}

ListOrder::ListOrder(const OrderOptions &options, const SortKeys &keys) {
  if (options.sort) {
    reversed_ = options.sort->rfind('-', 0) == 0;
    member_ = memberOf(options.sort->substr(reversed_ ? 1 : 0), keys);
  }
  if (options.limit) {
    const auto limit = parseNumber(*options.limit, 1, INT32_MAX);
    if (!limit) {
      throw Failure(kUsage, fmt::format("'{}' is not a valid limit: expected an integer from 1 to "
                                        "{}",
                                        *options.limit, INT32_MAX));
    }
    limit_ = static_cast<std::size_t>(*limit);
  }
}

// Values are compared by their types first. Null, for what is unknown, comes before all others, and
// a name that is not UTF-8 ({"base64": ...}) after all text; those are in the order of their
// base64.
void ListOrder::apply(Context &context, const std::string &name,
                      std::vector<Listed> &entries) const {
  if (!member_.empty()) {
    std::stable_sort(entries.begin(), entries.end(), [this](const Listed &a, const Listed &b) {
      return reversed_ ? b.entry[member_] < a.entry[member_] : a.entry[member_] < b.entry[member_];
    });
  }
  const std::size_t all = entries.size();
  entries.resize(std::min(all, limit_.value_or(all)));
  const std::size_t omitted = all - entries.size();
  Json::Value list(Json::arrayValue);
  for (const Listed &listed : entries) {
    list.append(listed.entry);
  }
  context.document[name] = list;
  context.document["omitted"] = Json::UInt64{omitted};
  if (omitted > 0 && !context.json) {
    context.remark(fmt::format("--limit leaves out {} of {}", omitted, all));
  }
}

void printRows(Context &context, Rows table, const std::vector<Listed> &entries, bool null) {
  for (const Listed &entry : entries) {
    for (const std::vector<std::string> &row : entry.rows) {
      table.add(row);
    }
  }
  table.print(context.out, null);
}

} // namespace KOVA::Backup::Tool
