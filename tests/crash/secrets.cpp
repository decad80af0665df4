// Several processes store secrets, with a key that the first of them makes, in a file that the
// first of them creates.

#include "kovabackup/option_map.h"
#include "tests/crash/files.h"
#include "tests/crash/shared.h"
#include "tests/crash/workload.h"

#include <filesystem>
#include <fstream>
#include <sys/stat.h>

namespace KovaTest::Crash {
namespace {

namespace fs = std::filesystem;
using KOVA::Backup::OptionMap;

constexpr int kActors = 2;
constexpr const char *kToken = "crash.secrets";
constexpr const char *kPrefix = "secret";
constexpr off_t kKeyBytes = 32;

std::string secretOf(int actor, int number) {
  return "secret " + std::to_string(actor) + " " + std::to_string(number);
}

// Replaces the section of the platform's configuration that names the key file.
void useKeyFile(const std::string &path) {
  const std::string configuration = ::getenv("KOVA_PLATFORM_CONF");
  const std::string text = contentOf(configuration);
  std::ofstream(configuration) << text.substr(0, text.find("[secret]")) << "[secret]\nkeyFile=\""
                               << path << "\"\n";
}

class Secrets : public Workload {
public:
  Secrets(const std::string &base, const std::string &keyBase)
      : base_(base + "/secrets/"), keyBase_(keyBase + "/key/") {
    startAgain();
  }

  const char *name() const override { return "secrets"; }
  int actors() const override { return kActors; }

  void prepare(Random &random) override {
    if (below(random, 2) == 0) {
      startAgain();
    }
  }

  void act(int actor, Random & /*random*/) override {
    OptionMap map;
    require(map.setLockToken(kToken), "setLockToken");
    // False if the section is there.
    if (!map.optSectionCreate(file(), kPrefix, actor + 1)) {
      require(map.optSectionLoad(file(), kPrefix, actor + 1), "optSectionLoad");
    }
    Progress &own = progress_->at(static_cast<std::size_t>(actor));
    for (int repeated = 0; repeated < 10; ++repeated) {
      const int next = own.kept + 1;
      own.attempted = next;
      map.optSet("number", next);
      map.optSet("password", secretOf(actor, next), true);
      require(map.optSecret("password", "") == secretOf(actor, next), "optSecret");
      require(map.optSectionSave(), "optSectionSave");
      own.kept = next;
    }
  }

  void check(Findings &findings) override {
    struct stat key = {};
    const bool hasKey = ::stat(keyFile().c_str(), &key) == 0;
    findings.expect(!hasKey || (key.st_size == kKeyBytes && (key.st_mode & 07777) == 0600),
                    "the key is torn: " + std::to_string(key.st_size) + " bytes");
    for (int actor = 0; actor < kActors; ++actor) {
      Progress &own = progress_->at(static_cast<std::size_t>(actor));
      OptionMap map;
      const bool exists = map.optSectionLoad(file(), kPrefix, actor + 1);
      findings.expect(exists || own.kept == 0, "a section is lost");
      const int found = map.optInt("number", 0);
      findings.expect(own.allows(found), differing("a secret is lost", own, found));
      findings.expect(found == 0 || hasKey, "a secret is there, but its key is lost");
      findings.expect(found == 0 || map.optSecret("password", "") == secretOf(actor, found),
                      "a secret cannot be read");
      addPromises(1);
      own.settle(found);
    }
    OptionMap map;
    findings.expect(map.setLockToken(kToken) &&
                        (map.optSectionCreate(file(), kPrefix, kActors + 1) ||
                         map.optSectionLoad(file(), kPrefix, kActors + 1)),
                    "the next writer fails");
    map.optSet("password", "next", true);
    findings.expect(map.optSecret("password", "") == "next" && map.optSectionSave(),
                    "the next writer has no secrets");
    findings.expect(leftovers(file()).empty(), "left behind: " + leftovers(file()));
  }

private:
  std::string folder() const { return base_ + std::to_string(generation_); }
  std::string file() const { return folder() + "/secrets.conf"; }
  std::string keyFolder() const { return keyBase_ + std::to_string(generation_); }
  std::string keyFile() const { return keyFolder() + "/made/secret.key"; }

  // Folders without file and key, in place of those before.
  void startAgain() {
    fs::remove_all(folder());
    fs::remove_all(keyFolder());
    ++generation_;
    makeFolder(folder());
    makeFolder(keyFolder());
    useKeyFile(keyFile());
    for (Progress &progress : *progress_) {
      progress.settle(0);
    }
  }

  const std::string base_;
  const std::string keyBase_;
  int generation_ = 0;
  std::array<Progress, kActors> *const progress_ = makeShared<std::array<Progress, kActors>>();
};

} // namespace

std::unique_ptr<Workload> makeSecrets(const std::string &base, const std::string &keyBase) {
  return std::make_unique<Secrets>(base, keyBase);
}

} // namespace KovaTest::Crash
