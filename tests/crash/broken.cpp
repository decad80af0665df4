// Workloads with a defect each. The tests that they are must find every one.

#include "kovabackup/option_map.h"
#include "tests/crash/files.h"
#include "tests/crash/shared.h"
#include "tests/crash/workload.h"

#include <cstdlib>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <unistd.h>

namespace KovaTest::Crash {
namespace {

using KOVA::Backup::OptionMap;

class BrokenWorkload : public Workload {
public:
  BrokenWorkload(const char *name, const std::string &base)
      : name_(name), folder_(makeFolder(base + "/" + name)) {}
  const char *name() const override { return name_; }
  int actors() const override { return 1; }

protected:
  std::string file() const { return folder_ + "/file"; }

  Progress *const progress_ = makeShared<Progress>();

private:
  const char *const name_;
  const std::string folder_;
};

// Reports a save as done before it is.
class ReportsEarly : public BrokenWorkload {
public:
  explicit ReportsEarly(const std::string &base) : BrokenWorkload("reports early", base) {}

  void act(int /*actor*/, Random & /*random*/) override {
    const int next = ++progress_->attempted;
    progress_->kept = next;
    OptionMap map;
    map.optSet("number", next);
    require(map.optSectionExport(file(), "section", true), "optSectionExport");
  }

  void check(Findings &findings) override {
    OptionMap map;
    const int found = map.optSectionLoad(file(), "section", -1) ? map.optInt("number", 0) : 0;
    findings.expect(progress_->allows(found), differing("a save is lost", *progress_, found));
    progress_->settle(found);
  }
};

// Writes a file in place, in two steps.
class WritesInPlace : public BrokenWorkload {
public:
  explicit WritesInPlace(const std::string &base) : BrokenWorkload("writes in place", base) {}

  void act(int /*actor*/, Random & /*random*/) override {
    const std::string next = std::to_string(++progress_->attempted);
    std::ofstream out(file());
    out << next << " " << std::flush;
    out << next << std::flush;
  }

  void check(Findings &findings) override {
    std::ifstream in(file());
    int first = 0;
    int second = 0;
    in >> first >> second;
    findings.expect(first == second && first > 0, "torn");
  }
};

// Takes a file that exists for a lock, which then outlives its holder.
class LocksByName : public BrokenWorkload {
public:
  explicit LocksByName(const std::string &base) : BrokenWorkload("locks by name", base) {}

  void act(int /*actor*/, Random & /*random*/) override {
    if (lock()) {
      (void)::unlink(file().c_str());
    }
  }

  void check(Findings &findings) override {
    findings.expect(lock(), "the next writer gets no lock");
    (void)::unlink(file().c_str());
  }

private:
  bool lock() const {
    const int fd = ::open(file().c_str(), O_CREAT | O_EXCL | O_WRONLY | O_CLOEXEC, 0600);
    ::close(fd);
    return fd >= 0;
  }
};

} // namespace

void addBrokenWorkloads(const std::string &base, Workloads &all) {
  all.push_back(std::make_unique<ReportsEarly>(base));
  all.push_back(std::make_unique<WritesInPlace>(base));
  all.push_back(std::make_unique<LocksByName>(base));
}

} // namespace KovaTest::Crash
