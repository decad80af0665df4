#ifndef KOVABACKUP_TOOLS_LIST_ORDER_H
#define KOVABACKUP_TOOLS_LIST_ORDER_H

/// @file The options --sort and --limit of the commands that list things.
///
///     SortKeys sortKeys() { return {{"bytes", "bytes"}, {"age", "ageSeconds"}}; }
///     ...
///     declareOrder(command, options->order, sortKeys());
///     ...
///     const ListOrder order(options.order, sortKeys()); // wrong usage is reported before the work
///     std::vector<Listed> entries = ...;
///     order.apply(context, "sessions", entries);        // the document has its list
///     printRows(context, sessionRows(), entries, options.null);

#include "tools/kovabackup/frame/cli.h"

#include <json/json.h>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace KOVA::Backup::Tool {

/// What a list can be sorted by: the name of the key, and the member of an entry that it means.
using SortKeys = std::vector<std::pair<std::string, std::string>>;

struct OrderOptions {
  std::optional<std::string> sort;
  std::optional<std::string> limit;
};

void declareOrder(Command &command, OrderOptions &options, const SortKeys &keys);

/// One thing of a list.
struct Listed {
  Json::Value entry;                          ///< in the document
  std::vector<std::vector<std::string>> rows; ///< for people and scripts, mostly one
};

class ListOrder {
public:
  /// Errors: throws a Failure (wrong usage) for an unknown key, or a limit that is not valid.
  ListOrder(const OrderOptions &options, const SortKeys &keys);

  /// Sorts the entries, removes those beyond the limit, and puts the rest into the document as a
  /// list of that name. The document's "omitted", and a remark, say how many were removed.
  void apply(Context &context, const std::string &name, std::vector<Listed> &entries) const;

private:
  std::string member_; ///< to sort by; "" to keep the order
  bool reversed_ = false;
  std::optional<std::size_t> limit_;
};

/// Prints the rows of the entries below the headings of a table that has none yet.
void printRows(Context &context, Rows table, const std::vector<Listed> &entries, bool null);

} // namespace KOVA::Backup::Tool

#endif
