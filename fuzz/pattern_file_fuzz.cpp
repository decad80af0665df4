// `kovabackup filter test` with patterns from options and from a file, and paths from standard
// input, all in memory and read in parts of any size. The paths that are kept, and with --explain
// the pattern that decided, are those of the plain rules. A file with another line is refused with
// that line, and then nothing is printed.
//
// Input: one byte of flags, one for the number of the parts, then up to the byte 1 the patterns of
// the options, one on each line as in the file, up to the byte 1 the file, and the paths.

#include "tools/kovabackup/commands/groups.h"
#include "tools/kovabackup/frame/invocation.h"

#include "fuzz/support.h"
#include "tests/path/filter/path_filter_oracle.h"

#include <cerrno>
#include <cstdarg>
#include <cstring>
#include <fcntl.h>
#include <memory>
#include <optional>
#include <sys/syscall.h>
#include <unistd.h>
#include <vector>

namespace {

constexpr const char *kFile = "patterns";
constexpr int kFd = 1000000; // no descriptor has this number

// What the command reads and writes during a run.
struct Streams {
  std::string_view file;
  std::string_view paths;
  std::size_t part = 1;
  std::string out;
};
Streams *streams = nullptr;

ssize_t takePart(std::string_view &from, void *buffer, std::size_t room) {
  const std::size_t size = std::min({from.size(), room, streams->part});
  std::memcpy(buffer, from.data(), size);
  from.remove_prefix(size);
  return static_cast<ssize_t>(size);
}

} // namespace

// In place of libc's. Outside of a run, and for other files, they do what libc's do.
extern "C" {

int open(const char *path, int flags, ...) {
  if (streams != nullptr && std::strcmp(path, kFile) == 0) {
    return kFd;
  }
  va_list args;
  va_start(args, flags);
  const long mode = (flags & O_CREAT) != 0 ? static_cast<long>(va_arg(args, unsigned)) : 0;
  va_end(args);
  return static_cast<int>(::syscall(SYS_openat, AT_FDCWD, path, flags, mode));
}

int close(int fd) {
  return fd == kFd ? 0 : static_cast<int>(::syscall(SYS_close, fd));
}

ssize_t read(int fd, void *buffer, std::size_t room) {
  if (streams != nullptr && (fd == kFd || fd == STDIN_FILENO)) {
    return takePart(fd == kFd ? streams->file : streams->paths, buffer, room);
  }
  return ::syscall(SYS_read, fd, buffer, room);
}

ssize_t write(int fd, const void *bytes, std::size_t size) {
  if (streams == nullptr) {
    return ::syscall(SYS_write, fd, bytes, size);
  }
  if (fd == STDOUT_FILENO) {
    streams->out.append(static_cast<const char *>(bytes), size);
  }
  return static_cast<ssize_t>(size);
}

int isatty(int) noexcept {
  return 0;
}

} // extern "C"

namespace {

using namespace KOVA::Backup::Tool;
using KovaFuzz::require;
using Strings = std::vector<std::string>;
namespace Oracle = KovaTest::Oracle;

constexpr unsigned kExplain = 1;
constexpr unsigned kNull = 2;
constexpr unsigned kQuiet = 4;

struct Run {
  unsigned flags = 0;
  std::size_t part = 1;
  Strings optionPatterns; // "+ PATTERN" or "- PATTERN"
  std::string file;
  std::string paths;
};

// The last one may lack the byte that ends it.
Strings records(const std::string &text, char end) {
  Strings found;
  std::string record;
  for (const char byte : text) {
    if (byte == end) {
      found.push_back(record);
      record.clear();
    } else {
      record += byte;
    }
  }
  if (!record.empty()) {
    found.push_back(record);
  }
  return found;
}

bool isPattern(const std::string &line) {
  return line.substr(0, 2) == "+ " || line.substr(0, 2) == "- ";
}

// All patterns in the order in which they decide; none when a line of the file is neither a
// pattern, nor empty, nor a comment.
std::optional<Strings> plainPatterns(const Run &run) {
  Strings lines = run.optionPatterns;
  for (const std::string &line : records(run.file, '\n')) {
    if (line.empty() || line[0] == '#') {
      continue;
    }
    if (!isPattern(line)) {
      return std::nullopt;
    }
    lines.push_back(line);
  }
  std::stable_partition(lines.begin(), lines.end(),
                        [](const std::string &line) { return line[0] == '+'; });
  return lines;
}

// The first pattern that matches; "" when there is none.
std::string decide(const Strings &patterns, const std::string &path) {
  for (const std::string &line : patterns) {
    if (Oracle::covers(line.substr(2).c_str(), path.c_str())) {
      return line;
    }
  }
  return "";
}

std::string expectedOutput(const Run &run, const Strings &patterns) {
  const char end = (run.flags & kNull) != 0 ? '\0' : '\n';
  std::string out;
  for (const std::string &path : records(run.paths, end)) {
    const std::string decided = decide(patterns, path);
    const bool kept = decided.empty() || decided[0] == '+';
    if ((run.flags & kExplain) != 0) {
      out += (kept ? "keep\t" : "drop\t") + decided + "\t" + path + end;
    } else if (kept) {
      out += path + end;
    }
  }
  return out;
}

Strings wordsOf(const Run &run) {
  Strings words = {"filter", "test", "--patterns", kFile};
  for (const std::string &line : run.optionPatterns) {
    words.emplace_back(line[0] == '+' ? "--include" : "--exclude");
    words.push_back(line.substr(2));
  }
  if ((run.flags & kExplain) != 0) {
    words.emplace_back("--explain");
  }
  if ((run.flags & kNull) != 0) {
    words.emplace_back("-0");
  }
  if ((run.flags & kQuiet) != 0) {
    words.emplace_back("--quiet");
  }
  return words;
}

int runCommand(const Run &run, std::string &out) {
  Streams used;
  used.file = run.file;
  used.paths = run.paths;
  used.part = run.part;
  streams = &used;
  Context context;
  const std::unique_ptr<Declaration> root = declareRoot(context);
  CommandGroup group(*root);
  registerFilter(group);
  const int code = invoke(*root, wordsOf(run), context);
  require(context.out.flush() == 0);
  streams = nullptr;
  out = used.out;
  return code;
}

Run takeRun(KovaFuzz::Input &input) {
  Run run;
  run.flags = input.byte();
  const std::size_t parts = 1 + input.byte() % 4; // each costs a block of memory
  const std::string options = input.until('\1');
  for (const std::string &line : records(std::string(options.c_str()), '\n')) {
    if (isPattern(line)) {
      run.optionPatterns.push_back(line);
    }
  }
  // The includes come first, wherever they are on the line.
  std::stable_partition(run.optionPatterns.begin(), run.optionPatterns.end(),
                        [](const std::string &line) { return line[0] == '+'; });
  run.file = input.until('\1');
  run.paths = input.rest();
  run.part = 1 + std::max(run.file.size(), run.paths.size()) / parts;
  return run;
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
  KovaFuzz::Input input(data, size);
  const Run run = takeRun(input);
  std::string out;
  const int code = runCommand(run, out);
  const std::optional<Strings> patterns = plainPatterns(run);
  require(code == (patterns ? kDone : kFailed));
  require(out == (patterns ? expectedOutput(run, *patterns) : ""));
  return 0;
}
