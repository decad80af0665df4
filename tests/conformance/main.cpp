// kovaplatform-conformance: whether a platform's libraries hold what libkovabackup-util needs of
// them. Uses their C interface only.

#include "tests/conformance/check.h"

#include <array>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <map>
#include <string>

namespace {

using KovaConformance::Check;

constexpr char kHelp[] =
    R"(Checks the libraries libkovacore, libkovasdk and libkovanetsdk of a platform.

Usage: kovaplatform-conformance [--list] [--scratch FOLDER] [NAME...]

  NAME               run only checks whose names begin so, e.g. core. or sdk.volume
  --list             print names and claims of the checks, run nothing
  --scratch FOLDER   work in a new folder below FOLDER; by default below $TMPDIR or /tmp

Each check prints one line:
  PASS NAME: what holds
  FAIL NAME: what does not; the library will not work as documented
  NOTE NAME: what does not; the library works, but a guide promises more
  SKIP NAME: why it cannot be tried on this machine

Run it as the user that the services run as, on a machine with a data volume that
has a share. It makes what the platform makes for any caller (the temporary folder
of a volume, the key of secrets) and leaves nothing else behind.

Exit code: 0 nothing failed, 1 something failed, 2 wrong usage.
)";

struct Options {
  bool list = false;
  std::string scratch;
  std::vector<std::string> names;
};

// Returns: false for an unknown or incomplete option.
bool parse(int argc, char **argv, Options &options) {
  const char *tmp = std::getenv("TMPDIR");
  options.scratch = tmp != nullptr && *tmp != '\0' ? tmp : "/tmp";
  for (int i = 1; i < argc; ++i) {
    const std::string word = argv[i];
    if (word == "--list") {
      options.list = true;
    } else if (word == "--scratch" && i + 1 < argc) {
      options.scratch = argv[++i];
    } else if (word.empty() || word[0] == '-') {
      return false;
    } else {
      options.names.push_back(word);
    }
  }
  return true;
}

bool isChosen(const Check &check, const std::vector<std::string> &names) {
  bool chosen = names.empty();
  for (const std::string &name : names) {
    chosen = chosen || std::string(check.name).rfind(name, 0) == 0;
  }
  return chosen;
}

std::vector<Check> chosenChecks(const std::vector<std::string> &names) {
  std::vector<Check> chosen;
  for (const auto &family : {KovaConformance::coreChecks(), KovaConformance::sectionChecks(),
                             KovaConformance::sdkChecks(), KovaConformance::netsdkChecks()}) {
    for (const Check &check : family) {
      if (isChosen(check, names)) {
        chosen.push_back(check);
      }
    }
  }
  return chosen;
}

int runAll(const std::vector<Check> &checks, const std::string &parent) {
  std::string scratch = parent + "/kovaplatform-conformance.XXXXXX";
  if (::mkdtemp(scratch.data()) == nullptr) {
    std::fprintf(stderr, "no folder below %s: %s\n", parent.c_str(), std::strerror(errno));
    return 1;
  }
  std::map<char, int> counts;
  for (const Check &check : checks) {
    ++counts[KovaConformance::runCheck(check, scratch)];
  }
  std::error_code ignored;
  std::filesystem::remove_all(scratch, ignored);
  std::printf("%d passed, %d failed, %d noted, %d skipped\n", counts['P'], counts['F'], counts['N'],
              counts['S']);
  return counts['F'] == 0 ? 0 : 1;
}

} // namespace

int main(int argc, char **argv) {
  if (argc == 2 && std::string(argv[1]) == "--help") {
    std::fputs(kHelp, stdout);
    return 0;
  }
  if (argc == 3 && std::string(argv[1]) == "--decrypts") { // by a check, see decryptsTheSecret
    return KovaConformance::decryptsTheSecret(argv[2]) ? 0 : 1;
  }
  Options options;
  if (!parse(argc, argv, options)) {
    std::fputs(kHelp, stderr);
    return 2;
  }
  const std::vector<Check> checks = chosenChecks(options.names);
  if (checks.empty()) {
    std::fputs("no check has such a name; see --list\n", stderr);
    return 2;
  }
  if (options.list) {
    for (const Check &check : checks) {
      std::printf("%s: %s\n", check.name, check.claim);
    }
    return 0;
  }
  return runAll(checks, std::filesystem::absolute(options.scratch).string());
}
