#include "check.h"

#include <kovabackup/service/published_file.h>
#include <kovabackup/service/run_lock.h>
#include <kovabackup/service/section_update.h>

#include <cerrno>
#include <fcntl.h>
#include <string>
#include <unistd.h>
#include <vector>

using namespace KOVA::Backup;
using namespace KOVA::Backup::Service;

namespace {

void callPublishedFile() {
  PublishedFile file("/tmp/tasks.conf", 0600);
  Error error;
  const std::string text = "[task1]\nruns=1\n";
  check(file.create(error, text.size()) && file.fd() >= 0, "create, fd");
  check(::write(file.fd(), text.data(), text.size()) == static_cast<ssize_t>(text.size()),
        "fd: the file");
  check(::access("/tmp/tasks.conf", F_OK) != 0, "a file that is not published");
  check(file.publish(error) && ::access("/tmp/tasks.conf", F_OK) == 0, "publish");
}

void callUpdateSection() {
  Error error;
  const auto count = [](OptionMap &options) {
    return options.optSet("runs", options.optInt("runs", 0) + 1);
  };
  check(updateSection("/tmp/tasks.conf", "task", 1, "tasks", count, Millis(0), &error) ==
            Update::Saved,
        "updateSection");
  check(updateSection("/tmp/tasks.conf", "task", 2, "tasks", count, Millis(0), &error) ==
                Update::NoSection &&
            error.code == ENOENT,
        "updateSection: no section");
}

void callRunLock() {
  RunLock lock("interface");
  RunLock second("interface");
  Error error;
  check(lock.take(error) && lock.fd() >= 0, "take, fd");
  check(!second.take(error, Millis(0)) && error.code == EWOULDBLOCK, "take: held");
  check(::access(RunLock::path("interface").c_str(), F_OK) == 0, "path");
  LockHolder holder;
  check(RunLock::holder("interface", holder) && holder.taker == ::getpid() && holder.alive,
        "holder");
  std::vector<LockUser> users;
  check(RunLock::users("interface", users, error) && users.size() == 1 &&
            users[0].pid == ::getpid() && !users[0].waits,
        "users");
  lock.release();
  check(!RunLock::holder("interface", holder) && second.take(error), "release");
}

} // namespace

void callFiles() {
  callPublishedFile();
  callUpdateSection();
  callRunLock();
}
