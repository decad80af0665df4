#include "archive.h"

#include <csignal>
#include <cstring>
#include <fcntl.h>
#include <iterator>
#include <kovabackup/service/command.h>
#include <sstream>
#include <sys/mman.h>
#include <unistd.h>

using namespace KOVA::Backup;
using namespace KOVA::Backup::Service;

namespace {

constexpr Millis kTick(200);

std::string whyFailed(const std::string &program, const Result &result) {
  const std::string said = printable(result.err.text.substr(0, result.err.text.find('\n')));
  const std::string end = (result.end == Result::End::Signalled ? "signal " : "exit status ") +
                          std::to_string(result.code);
  return said.find(program) == 0 ? said : program + ": " + (said.empty() ? end : said);
}

// Programs that are connected by pipes, and succeed or fail as one.
class Pipeline {
public:
  // Appends a program: its name and arguments, separated by white space, and more arguments.
  Command &add(const std::string &words, const std::vector<std::string> &more = {}) {
    std::istringstream in("/usr/bin/" + words);
    std::vector<std::string> argv{std::istream_iterator<std::string>(in), {}};
    requireCall(::access(argv.front().c_str(), X_OK) == 0, argv.front());
    argv.insert(argv.end(), more.begin(), more.end());
    programs_.push_back(fs::path(argv.front()).filename());
    order_.push_back(&commands_.emplace_back(std::move(argv)));
    return last().env("LC_ALL", "C").capture(Stream::Err, 4096).cancelledBy(stop());
  }

  // Appends gpg. The passphrase reaches it through a descriptor, because other processes can read
  // the arguments and the environment of a program.
  void addGpg(const std::string &operation, const std::string &passphrase) {
    passphrase_.reset(::fdopen(::memfd_create("passphrase", MFD_CLOEXEC), "w+"));
    requireCall(passphrase_ && std::fputs(passphrase.c_str(), passphrase_.get()) >= 0 &&
                    std::fflush(passphrase_.get()) == 0 &&
                    std::fseek(passphrase_.get(), 0, SEEK_SET) == 0,
                "cannot pass on the passphrase");
    // Without a home, keys and locks gpg writes no file. With a fixed count it does not ask its
    // agent how fast the machine is. It needs no agent then, so nothing outlives the pipeline.
    add("gpg --homedir /nonexistent --no-options --no-keyring --lock-never --no-random-seed-file"
        " --no-autostart --batch --quiet --no-tty --pinentry-mode loopback --passphrase-fd 3"
        " --s2k-count 65011712 --cipher-algo AES256 --compress-algo none " +
        operation)
        .passFd(::fileno(passphrase_.get()), 3);
  }

  Command &first() { return commands_.front(); }
  Command &last() { return commands_.back(); }

  void run() {
    const std::vector<Result> results = runPipeline(order_);
    require(!stop().requested(), "interrupted");
    std::string failure;
    for (std::size_t i = results.size(); i-- > 0;) {
      const bool exited = results[i].end == Result::End::Exited && results[i].error.code == 0;
      // Exit status 1 of tar: a file changed while tar read it. A warning has named it.
      const bool succeeded = exited && results[i].code <= (programs_[i] == "tar" ? 1 : 0);
      // A program that ended because its reader had ended is not the cause.
      const bool lostReader = !exited && results[i].code == SIGPIPE;
      if (!succeeded && (failure.empty() || !lostReader)) {
        failure = whyFailed(programs_[i], results[i]);
      }
    }
    require(failure.empty(), failure);
  }

private:
  std::vector<std::string> programs_;
  std::list<Command> commands_;
  std::vector<const Command *> order_;
  File passphrase_;
};

// Reads an archive by the programs that its kind requires and tar.
void read(const std::string &path, const Key &key, const std::string &tar,
          const std::vector<std::string> &more, Stream stream, const LineAction &line) {
  const File archive = openFile(path, "r");
  const std::string kind = fs::path(path).extension();
  Pipeline pipeline;
  if (kind == ".age") {
    require(!key.identity.empty(), "the archive requires --identity");
    pipeline.add("age --decrypt --identity", {fs::weakly_canonical(key.identity)});
  } else if (kind == ".gpg") {
    require(!key.passphrase.empty(), "the archive requires --passphrase-stdin");
    pipeline.addGpg("--decrypt", key.passphrase);
  }
  pipeline.add("zstd --quiet --decompress --stdout");
  pipeline.add(tar, more).lines(stream, line);
  pipeline.first().inputFd(::fileno(archive.get())).every(kTick, [&archive] {
    const off_t position = ::lseek(::fileno(archive.get()), 0, SEEK_CUR); // of the program, too
    showProgress(sizeText(static_cast<std::uint64_t>(position)) + " read");
  });
  pipeline.run();
}

} // namespace

Cancel &stop() {
  static Cancel cancel;
  return cancel;
}

void writeArchive(const OptionMap &task, int archive, const std::function<File()> &makeList,
                  const LineAction &warn, const std::function<void()> &tick) {
  Pipeline pipeline;
  pipeline.add("tar --create --directory=/ --null --verbatim-files-from --no-recursion"
               " --files-from=- --format=posix --numeric-owner --acls --xattrs"
               " --ignore-failed-read");
  pipeline.add("zstd --quiet --stdout -" + task.optString("level", ""));
  if (isSet(task, "recipient")) {
    pipeline.add("age --encrypt --recipient", {task.optString("recipient", "")});
  } else if (isSet(task, "passphrase")) {
    pipeline.addGpg("--symmetric", task.optSecret("passphrase", ""));
  }
  pipeline.last().toFd(Stream::Out, archive);
  const File list = makeList();
  pipeline.first().inputFd(::fileno(list.get())).lines(Stream::Err, warn).every(kTick, tick);
  try {
    pipeline.run();
  } catch (const std::runtime_error &failure) {
    const std::string space = spaceText(archive);
    // Whether the file can grow. It is discarded, so it may.
    const int code = ::posix_fallocate(archive, ::lseek(archive, 0, SEEK_END), 65536);
    const std::string reason = code == 0 ? "" : std::strerror(code) + std::string(", ");
    require(false, failure.what() + (" (" + reason + space + ")"));
  }
}

void checkArchive(const std::string &path, const Key &key) {
  int entries = 0; // tar writes a line for each
  read(path, key, "tar --list --quoting-style=escape", {}, Stream::Out,
       [&entries](std::string_view) { ++entries; });
  showMessage(stringf("%s: complete, %d entries", path.c_str(), entries), std::cout);
}

void restoreArchive(const std::string &path, const Key &key, const std::vector<std::string> &paths,
                    const std::string &folder) {
  fs::create_directories(folder);
  std::vector<std::string> arguments = {"--directory", fs::absolute(folder), "--"};
  for (const std::string &selected : paths) {
    arguments.push_back(fs::path(selected).relative_path());
  }
  read(path, key,
       "tar --extract --preserve-permissions --numeric-owner --acls --xattrs"
       " --xattrs-include=* --no-unquote",
       arguments, Stream::Err,
       [](std::string_view line) { showMessage(printable(std::string(line))); });
}
