#ifndef KOVABACKUP_TESTS_CRASH_WORKLOAD_H
#define KOVABACKUP_TESTS_CRASH_WORKLOAD_H

/// @file What processes do until they are killed or the power is cut, and what must hold then.

#include "tests/support/findings.h"

#include <chrono>
#include <memory>
#include <random>
#include <string>
#include <vector>

namespace KovaTest::Crash {

using Random = std::mt19937_64;

/// A number from 0 to below.
inline int below(Random &random, int limit) {
  return static_cast<int>(random() % static_cast<unsigned>(limit));
}

class Workload {
public:
  Workload() = default;
  virtual ~Workload() = default;
  Workload(const Workload &) = delete;
  Workload &operator=(const Workload &) = delete;

  virtual const char *name() const = 0;

  /// Before each round, when no process runs.
  virtual void prepare(Random & /*random*/) {}

  /// The number of processes that act at once.
  virtual int actors() const = 0;

  /// How long a process acts at most before it is killed.
  virtual std::chrono::microseconds span(int /*actor*/) const {
    return std::chrono::milliseconds(20);
  }

  /// In a process of its own, again and again. Never returns when it becomes a program.
  virtual void act(int actor, Random &random) = 0;

  /// Whether act becomes a program, which ends by itself if it is not killed, with which status.
  virtual bool isProgram(int /*actor*/) const { return false; }
  virtual bool mayExitWith(int status) const { return status == 0; }

  /// After each round, when no process runs any more.
  virtual void check(Findings &findings) = 0;

  /// The number of promises that were compared with the disk.
  long promises() const { return promises_; }

protected:
  void addPromises(long count) { promises_ += count; }

private:
  long promises_ = 0;
};

using Workloads = std::vector<std::unique_ptr<Workload>>;

/// Each keeps what it writes in a folder of its own below base.
std::unique_ptr<Workload> makeCounters(const std::string &base);
std::unique_ptr<Workload> makeSections(const std::string &base);
/// The key is below keyBase.
std::unique_ptr<Workload> makeSecrets(const std::string &base, const std::string &keyBase);
std::unique_ptr<Workload> makeArchives(const std::string &base);
std::unique_ptr<Workload> makeService(const std::string &base);
std::unique_ptr<Workload> makeSessions();

/// With a defect each, which must be found: the tests of the test.
void addBrokenWorkloads(const std::string &base, Workloads &all);

} // namespace KovaTest::Crash

#endif
