#include "tests/platform/real_mounts.h"

#include "tests/support/child_process.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <gtest/gtest.h>
#include <sys/mount.h>
#include <thread>

namespace KovaTest {
namespace {

namespace fs = std::filesystem;

constexpr const char *kRoot = "/mnt";

std::string target(const std::string &name) {
  return std::string(kRoot) + "/" + name;
}

// The kernel releases the image of a loop device only a moment after the disk on it is unmounted.
bool unmountOnceFree(const std::string &path) {
  const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(20);
  while (::umount2(path.c_str(), 0) != 0) {
    if (errno != EBUSY || std::chrono::steady_clock::now() > deadline) {
      return false;
    }
    std::this_thread::sleep_for(std::chrono::milliseconds(10));
  }
  return true;
}

} // namespace

int runFor(const std::string &command, std::string &output) {
  const std::string whole = "exec 2>&1; PATH=$PATH:/usr/sbin:/sbin; " + command;
  const ShellResult result = runShell(whole);
  output = result.output;
  return result.exitCode;
}

std::string run(const std::string &command) {
  std::string output;
  if (runFor(command, output) == 0) {
    return "";
  }
  return output.empty() ? command + " failed" : output.substr(0, output.find_last_not_of('\n') + 1);
}

RealMounts::RealMounts() {
  if (::mount("tmpfs", kRoot, "tmpfs", 0, "mode=0755") != 0) {
    ADD_FAILURE() << "mounting a tmpfs on /mnt: " << std::strerror(errno);
    return;
  }
  paths_.emplace_back(kRoot);
  fs::create_directory(target(".images"));
}

RealMounts::~RealMounts() {
  while (!paths_.empty()) {
    const std::string path = paths_.back();
    paths_.pop_back();
    if (!unmountOnceFree(path)) {
      ADD_FAILURE() << "unmounting " << path << ": " << std::strerror(errno);
      (void)::umount2(path.c_str(), MNT_DETACH);
    }
  }
}

std::string RealMounts::image(const std::string &name) {
  std::string file = name;
  std::replace(file.begin(), file.end(), '/', '_');
  return target(".images/" + file);
}

std::string RealMounts::mount(const std::string &command, const std::string &name) {
  std::error_code error;
  fs::create_directories(target(name), error);
  const std::string why = run(command + " " + target(name));
  if (why.empty()) {
    paths_.push_back(target(name));
  }
  return why;
}

std::string RealMounts::tmpfs(const std::string &name) {
  return mount("mount -n -t tmpfs -o size=8m,mode=0755 tmpfs", name);
}

std::string RealMounts::disk(const std::string &kind, const std::string &name, int mebibytes) {
  const std::string file = image(name);
  const std::string made = run("truncate -s " + std::to_string(mebibytes) + "M " + file +
                               " && mkfs." + kind + (kind == "vfat" ? " " : " -q ") + file);
  return made.empty() ? mount("mount -n -t " + kind + " -o loop " + file, name) : made;
}

std::string RealMounts::bind(const std::string &fromPath, const std::string &name) {
  return mount("mount -n --bind " + fromPath, name);
}

std::string RealMounts::remount(const std::string &name, Access access) {
  // The flag of the mount, because a user namespace may not change that of the file system.
  const unsigned long flags = MS_REMOUNT | MS_BIND | (access == Access::ReadOnly ? MS_RDONLY : 0);
  return ::mount(nullptr, target(name).c_str(), nullptr, flags, nullptr) == 0
             ? ""
             : std::strerror(errno);
}

void RealMounts::unmount(const std::string &name) {
  const auto last = std::find(paths_.rbegin(), paths_.rend(), target(name));
  ASSERT_NE(paths_.rend(), last);
  ASSERT_EQ(0, ::umount2(target(name).c_str(), 0)) << std::strerror(errno);
  paths_.erase(std::next(last).base());
}

} // namespace KovaTest
