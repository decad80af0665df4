// Processes publish files: new ones, and one that is replaced again and again.

#include "kovabackup/service/published_file.h"
#include "tests/crash/files.h"
#include "tests/crash/shared.h"
#include "tests/crash/workload.h"

#include <cstdlib>
#include <filesystem>
#include <unistd.h>

namespace KovaTest::Crash {
namespace {

namespace fs = std::filesystem;
using KOVA::Backup::Service::Error;
using KOVA::Backup::Service::PublishedFile;

constexpr int kActors = 2;
constexpr const char *kIndex = "index";

// Up to 200 KB, which says which file it is of.
std::string contentFor(const std::string &name, int number) {
  const std::string line = name + " " + std::to_string(number) + "\n";
  const std::size_t lines = static_cast<std::size_t>(number * 1237 % 16000) + 1;
  std::string content;
  for (std::size_t count = 0; count < lines; ++count) {
    content += line;
  }
  return content + "end\n";
}

bool publish(const std::string &path, const std::string &content) {
  PublishedFile file(path);
  Error error;
  if (!file.create(error, content.size())) {
    return false;
  }
  for (std::size_t at = 0; at < content.size();) {
    const ssize_t wrote = ::write(file.fd(), content.data() + at, content.size() - at);
    if (wrote <= 0) {
      return false;
    }
    at += static_cast<std::size_t>(wrote);
  }
  return file.publish(error);
}

struct Published {
  int first = 1; // that was not removed
  Progress archives;
  Progress index;
};

class Archives : public Workload {
public:
  explicit Archives(const std::string &base) : base_(makeFolder(base + "/archives")) {
    for (int actor = 0; actor < kActors; ++actor) {
      makeFolder(folderOf(actor));
    }
  }

  const char *name() const override { return "archives"; }
  int actors() const override { return kActors; }

  void prepare(Random & /*random*/) override {
    for (int actor = 0; actor < kActors; ++actor) {
      for (const std::string &name : namesIn(folderOf(actor))) {
        if (name != kIndex) {
          fs::remove(folderOf(actor) + "/" + name);
        }
      }
      of(actor).first = of(actor).archives.kept + 1;
    }
  }

  void act(int actor, Random & /*random*/) override {
    const std::string folder = folderOf(actor);
    Progress &archives = of(actor).archives;
    const std::string name = std::to_string(++archives.attempted);
    require(publish(folder + "/" + name, contentFor(name, archives.attempted)), "publishing");
    archives.kept = archives.attempted.load();
    Progress &index = of(actor).index;
    ++index.attempted;
    require(publish(folder + "/" + kIndex, contentFor(kIndex, index.attempted)), "replacing");
    index.kept = index.attempted.load();
  }

  void check(Findings &findings) override {
    for (int actor = 0; actor < kActors; ++actor) {
      checkArchives(actor, findings);
      checkIndex(actor, findings);
      Error error;
      const std::string index = folderOf(actor) + "/" + kIndex;
      PublishedFile next(index);
      findings.expect(next.create(error), "the next one cannot publish");
      findings.expect(leftovers(index).empty(), "left behind: " + leftovers(index));
    }
  }

private:
  std::string folderOf(int actor) const { return base_ + "/" + std::to_string(actor); }
  Published &of(int actor) const { return published_->at(static_cast<std::size_t>(actor)); }

  void checkArchives(int actor, Findings &findings) {
    Progress &archives = of(actor).archives;
    const std::string folder = folderOf(actor) + "/";
    for (const std::string &name : namesIn(folder)) {
      const bool isArchive = name != kIndex && name.front() != '.';
      findings.expect(!isArchive ||
                          contentOf(folder + name) == contentFor(name, std::atoi(name.c_str())),
                      "torn: " + folder + name + ", " +
                          std::to_string(contentOf(folder + name).size()) + " bytes");
    }
    for (int number = of(actor).first; number <= archives.kept; ++number) {
      findings.expect(fs::exists(folder + std::to_string(number)),
                      "lost: " + folder + std::to_string(number));
      addPromises(1);
    }
    // A name is used only once, also if its file is not there.
    archives.settle(archives.attempted);
  }

  void checkIndex(int actor, Findings &findings) {
    Progress &index = of(actor).index;
    const std::string content = contentOf(folderOf(actor) + "/" + kIndex);
    const std::size_t digits = content.find(' ');
    const int found = digits == std::string::npos ? 0 : std::atoi(content.c_str() + digits);
    findings.expect(index.allows(found), differing("a replacement is lost", index, found));
    findings.expect(found == 0 ? !fs::exists(folderOf(actor) + "/" + kIndex)
                               : content == contentFor(kIndex, found),
                    "the index is torn");
    addPromises(1);
    index.settle(found);
  }

  const std::string base_;
  std::array<Published, kActors> *const published_ = makeShared<std::array<Published, kActors>>();
};

} // namespace

std::unique_ptr<Workload> makeArchives(const std::string &base) {
  return std::make_unique<Archives>(base);
}

} // namespace KovaTest::Crash
