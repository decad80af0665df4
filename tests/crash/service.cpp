// The example service runs a task again and again. An archive is announced when the run prints its
// path.

#include "kovabackup/option_map.h"
#include "tests/crash/files.h"
#include "tests/crash/programs.h"
#include "tests/crash/workload.h"

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <set>

namespace KovaTest::Crash {
namespace {

namespace fs = std::filesystem;
using KOVA::Backup::OptionMap;

// Outside the disk whose power is cut.
constexpr const char *kSource = "/tmp/service/source";
constexpr const char *kOutput = "/tmp/service/output";

class Service : public Workload {
public:
  explicit Service(const std::string &base)
      : destination_(makeFolder(base + "/service/archives")), tasks_(base + "/service/tasks.conf") {
    makeSource();
    std::ofstream(kOutput) << std::flush; // none has been announced
    mustHold(runProgram({KOVA_EXAMPLE_PATH, "--tasks", tasks_, "add", "--name", "crash", "--source",
                         kSource, "--destination", destination_, "--keep", "3"}) == 0,
             "adding a task");
    const auto start = std::chrono::steady_clock::now();
    mustHold(runProgram(runArguments(), kOutput) == 0, "running the task");
    running_ = std::chrono::duration_cast<std::chrono::microseconds>(
                   std::chrono::steady_clock::now() - start) *
               2; // it runs alone here
  }

  const char *name() const override { return "service"; }
  int actors() const override { return 1; }
  bool isProgram(int /*actor*/) const override { return true; }
  std::chrono::microseconds span(int /*actor*/) const override { return running_; }

  void act(int /*actor*/, Random & /*random*/) override { becomeProgram(runArguments(), kOutput); }

  void check(Findings &findings) override {
    for (const std::string &name : namesIn(destination_)) {
      const std::string path = destination_ + "/" + name;
      findings.expect(name.rfind("crash-", 0) == 0, "left behind: " + path);
      // Once found complete, an archive is not read again.
      if (complete_.count(path) == 0) {
        findings.expect(runProgram({KOVA_EXAMPLE_PATH, "check", path}) == 0, "torn: " + path);
        complete_.insert(path);
      }
    }
    const std::string announced = lastAnnounced();
    findings.expect(announced.empty() || fs::exists(announced), "lost: " + announced);
    const bool isNew = announced != announced_;
    addPromises(isNew ? 1 : 0);
    announced_ = announced;
    adaptSpan(isNew);
    OptionMap task;
    findings.expect(task.optSectionLoad(tasks_, "task", 1) &&
                        task.optString("destination", "") == destination_,
                    "the task is lost");
    static const std::set<std::string> results = {"did not end", "ok", "warnings"};
    findings.expect(results.count(task.optString("lastResult", "")) == 1,
                    "the result is " + task.optString("lastResult", ""));
  }

private:
  std::vector<std::string> runArguments() const {
    return {KOVA_EXAMPLE_PATH, "--tasks", tasks_, "run", "1"};
  }

  static void makeSource() {
    for (int folder = 0; folder < 5; ++folder) {
      const std::string path = std::string(kSource) + "/" + std::to_string(folder);
      fs::create_directories(path);
      for (int file = 0; file < 10; ++file) {
        std::ofstream(path + "/" + std::to_string(file)) << std::string(2000, 'a');
      }
    }
    Random random(1); // what cannot be compressed
    std::ofstream noise(std::string(kSource) + "/noise", std::ios::binary);
    for (int word = 0; word < 50000; ++word) {
      const auto bytes = random();
      noise.write(reinterpret_cast<const char *>(&bytes), sizeof bytes);
    }
  }

  // The path in the last line of the form "ok; 51 files, 500 KiB -> PATH, 400 KiB".
  static std::string lastAnnounced() {
    const std::string arrow = " -> ";
    std::ifstream output(kOutput);
    std::string path;
    for (std::string line; std::getline(output, line);) {
      const std::size_t begin = line.find(arrow);
      if (begin != std::string::npos) {
        path = line.substr(begin + arrow.size(), line.rfind(", ") - begin - arrow.size());
      }
    }
    return path;
  }

  // On a machine of any speed and load, about half of the runs come to their end.
  void adaptSpan(bool hasEnded) {
    constexpr std::chrono::microseconds kLongest = std::chrono::seconds(1);
    running_ = std::min(hasEnded ? running_ * 4 / 5 : running_ * 5 / 4, kLongest);
  }

  const std::string destination_;
  const std::string tasks_;
  std::chrono::microseconds running_{0};
  std::set<std::string> complete_;
  std::string announced_;
};

} // namespace

std::unique_ptr<Workload> makeService(const std::string &base) {
  return std::make_unique<Service>(base);
}

} // namespace KovaTest::Crash
