#include "tools/kovabackup/commands/groups.h"

#include "kovabackup/path_filter.h"
#include "tools/kovabackup/facts/pattern_warnings.h"
#include "tools/kovabackup/frame/input.h"

#include <fmt/format.h>
#include <map>
#include <unistd.h>

namespace KOVA::Backup::Tool {
namespace {

struct TestOptions {
  std::vector<std::string> include;
  std::vector<std::string> exclude;
  std::optional<std::string> patterns;
  bool explain = false;
  bool null = false;
};

struct Pattern {
  bool include;
  std::string text;
  std::string from; ///< the option, or the file and line
};

constexpr std::size_t kMostWarnings = 10;

// "+ PATTERN" or "- PATTERN". Everything after the one space belongs to the pattern, so that a
// pattern may begin or end with a space.
Pattern parsePattern(const std::string &line, const std::string &from) {
  if (line.size() < 2 || (line[0] != '+' && line[0] != '-') || line[1] != ' ') {
    throw Failure(kFailed,
                  fmt::format("{}: neither '+ PATTERN' nor '- PATTERN': '{}'", from, line));
  }
  return {line[0] == '+', line.substr(2), from};
}

void readPatterns(Context &context, const std::string &file, std::vector<Pattern> &patterns) {
  RecordReader lines(file, /*null=*/false);
  std::string line;
  bool remarked = false;
  for (int number = 1; lines.next(line); ++number) {
    if (line.empty() || line[0] == '#') {
      continue;
    }
    const std::string from = fmt::format("{}, line {}", file, number);
    patterns.push_back(parsePattern(line, from));
    if (line.back() == '\r' && !remarked) {
      context.remark(from + ": the pattern ends in a carriage return; does the file have DOS line "
                            "endings?");
      remarked = true;
    }
  }
}

// Of several patterns that match, --explain names the first. Patterns from options come before
// those from the file.
std::vector<Pattern> collectPatterns(Context &context, const TestOptions &options) {
  std::vector<Pattern> patterns;
  for (const std::string &text : options.include) {
    patterns.push_back({true, text, "--include"});
  }
  for (const std::string &text : options.exclude) {
    patterns.push_back({false, text, "--exclude"});
  }
  if (options.patterns == "-") {
    throw Failure(kUsage, "the paths come from standard input, so the patterns cannot");
  }
  if (options.patterns) {
    readPatterns(context, *options.patterns, patterns);
  }
  return patterns;
}

// A file of another tool's rules would otherwise fill the screen.
void warnAbout(Context &context, const std::vector<Pattern> &patterns) {
  std::size_t count = 0;
  for (const Pattern &pattern : patterns) {
    for (const std::string &warning : warningsAbout(pattern.text)) {
      if (++count <= kMostWarnings) {
        context.remark(fmt::format("{}: '{}': {}", pattern.from, pattern.text, warning));
      }
    }
  }
  if (count > kMostWarnings) {
    context.remark(
        fmt::format("{} more warnings about patterns are left out", count - kMostWarnings));
  }
}

// Gives the same answer as one filter with all patterns and names the pattern that decided: the
// first include pattern that matches, else the first exclude pattern that matches. A PathFilter
// does not say which pattern matched, so each pattern gets a filter of its own. Include patterns
// are added there as exclude patterns, too: filterOut then returns whether the pattern matches.
class Explainer {
public:
  explicit Explainer(std::vector<Pattern> patterns) : patterns_(std::move(patterns)) {
    for (const Pattern &pattern : patterns_) {
      filters_.push_back(std::make_unique<PathFilter>());
      filters_.back()->addExcludePattern(pattern.text);
    }
  }

  /// The pattern that decides, or null when none matches; then the path is kept.
  const Pattern *decide(const std::string &path) const {
    for (const bool include : {true, false}) {
      for (std::size_t i = 0; i < patterns_.size(); ++i) {
        if (patterns_[i].include == include && filters_[i]->filterOut(path)) {
          return &patterns_[i];
        }
      }
    }
    return nullptr;
  }

private:
  std::vector<Pattern> patterns_;
  std::vector<std::unique_ptr<PathFilter>> filters_;
};

std::string patternLine(const Pattern *pattern) {
  return pattern == nullptr ? "" : (pattern->include ? "+ " : "- ") + pattern->text;
}

bool kept(const Pattern *pattern) {
  return pattern == nullptr || pattern->include;
}

// The rest of a JSON entry after its path. It depends only on the pattern that decided.
std::string entryTail(const Pattern *pattern) {
  if (pattern == nullptr) {
    return R"(,"kept":true,"pattern":null,"list":null})";
  }
  std::string text =
      pattern->include ? R"(,"kept":true,"pattern":)" : R"(,"kept":false,"pattern":)";
  appendJsonName(text, pattern->text);
  return text + (pattern->include ? R"(,"list":"include"})" : R"(,"list":"exclude"})");
}

// Writes each entry as text as soon as its path is read. Kept as JSON values, several million paths
// would not fit into memory.
void explainAsJson(Context &context, const Explainer &explainer, RecordReader &paths) {
  std::map<const Pattern *, std::string> tails; // built once per pattern, not once per path
  context.beginList("paths");
  std::string path;
  std::string entry;
  while (!context.out.failed() && paths.next(path)) {
    const Pattern *pattern = explainer.decide(path);
    std::string &tail = tails[pattern];
    if (tail.empty()) {
      tail = entryTail(pattern);
    }
    entry = R"({"path":)";
    appendJsonName(entry, path);
    entry += tail;
    context.listEntry(entry);
  }
}

void explain(Context &context, const std::vector<Pattern> &patterns, RecordReader &paths,
             char end) {
  const Explainer explainer(patterns);
  if (context.json) {
    explainAsJson(context, explainer, paths);
    return;
  }
  std::string path;
  while (!context.out.failed() && paths.next(path)) {
    const Pattern *pattern = explainer.decide(path);
    context.out.write(kept(pattern) ? "keep\t" : "drop\t");
    context.out.write(context.out.name(patternLine(pattern)));
    context.out.write("\t");
    context.out.name(path, end);
  }
}

void addPatterns(PathFilter &filter, const std::vector<Pattern> &patterns) {
  for (const Pattern &pattern : patterns) {
    if (pattern.include) {
      filter.addIncludePattern(pattern.text);
    } else {
      filter.addExcludePattern(pattern.text);
    }
  }
}

void printKeptAsJson(Context &context, PathFilter &filter, RecordReader &paths) {
  context.beginList("kept");
  std::string path;
  std::string entry;
  while (!context.out.failed() && paths.next(path)) {
    if (!filter.filterOut(path)) {
      entry.clear();
      appendJsonName(entry, path);
      context.listEntry(entry);
    }
  }
}

// Uses one filter for all patterns, which is much faster than one per pattern. Only --explain needs
// the latter.
void printKept(Context &context, const std::vector<Pattern> &patterns, RecordReader &paths,
               char end) {
  PathFilter filter;
  addPatterns(filter, patterns);
  if (context.json) {
    printKeptAsJson(context, filter, paths);
    return;
  }
  std::string path;
  while (!context.out.failed() && paths.next(path)) {
    if (filter.filterOut(path)) {
      continue;
    }
    if (context.out.terminal()) {
      context.out.name(path, end);
    } else { // one call instead of two: this loop determines the speed on large lists
      path += end;
      context.out.write(path);
    }
  }
}

int test(Context &context, const TestOptions &options) {
  const std::vector<Pattern> patterns = collectPatterns(context, options);
  warnAbout(context, patterns);
  if (::isatty(STDIN_FILENO) == 1) {
    // Otherwise a user who forgot the pipe would wait for output that never comes.
    context.remark(options.null ? "reading paths from standard input, each ended by a NUL byte"
                                : "reading paths from standard input, one per line");
  }
  RecordReader paths("-", options.null);
  const char end = options.null ? '\0' : '\n';
  if (options.explain) {
    explain(context, patterns, paths, end);
  } else {
    printKept(context, patterns, paths, end);
  }
  return kDone;
}

} // namespace

void registerFilter(CommandGroup &root) {
  CommandGroup group = root.group("filter", "Test include and exclude patterns on paths");
  group.example("find /volume1/photo | kovabackup filter test --exclude '/**/*.tmp'");
  auto options = std::make_shared<TestOptions>();
  group.command("test", "Read paths from standard input and print those that are kept")
      .repeated(
          options->include, "--include", "PATTERN",
          "keep what matches, even if another pattern excludes it; may be given several times")
      .repeated(options->exclude, "--exclude", "PATTERN",
                "leave out what matches; may be given several times")
      .option(options->patterns, "--patterns", "FILE",
              "read more patterns, one per line, as '+ PATTERN' to include and '- PATTERN' to "
              "exclude; empty lines and those that begin with # are skipped")
      .completes(Completes::Files)
      .flag(options->explain, "--explain",
            "print every path, preceded by keep or drop and by the pattern that decided")
      .nullFlag(options->null, "paths end in a NUL byte, when read and when printed")
      .note("A pattern matches the entire path: * matches any bytes except a slash, ? exactly one "
            "such byte, ** any bytes, and a backslash makes the next byte literal. A path that no "
            "pattern matches is kept. The exit code is 0 even if no path is kept.")
      .note("Warnings name patterns that never match, and those that look like another tool's: "
            "there are no bracket classes, no alternatives in braces and no negation. They do not "
            "change the exit code.")
      .example("find /volume1/photo | kovabackup filter test --exclude '/**/*.tmp'")
      .example("echo /a/b/c | kovabackup filter test --explain --exclude '/a/**' --include "
               "'/a/b/*'")
      .example("find /volume1/photo -print0 | kovabackup filter test -0 --patterns rules | "
               "xargs -0 -r ls -d")
      .action([options](Context &c) { return test(c, *options); });
}

} // namespace KOVA::Backup::Tool
