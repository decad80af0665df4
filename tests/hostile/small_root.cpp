#include "tests/hostile/small_root.h"

#include "tests/hostile/surroundings.h"

#include <filesystem>
#include <sys/mount.h>
#include <unistd.h>

namespace KovaTest::Hostile {

namespace fs = std::filesystem;

SmallRoot::SmallRoot(const std::set<std::string> &folders) : path_(stage() + "/root") {
  need(std::string(KOVA_TEST_BINARY_DIR).rfind("/tmp/", 0) != 0 || folders.count("/tmp") != 0,
       "the programs are in /tmp");
  fs::create_directory(path_);
  mountOn(path_, "mode=0755");
  for (const std::string name : {"/bin", "/sbin", "/lib", "/lib32", "/lib64"}) {
    if (fs::is_symlink(name)) {
      fs::copy_symlink(name, path_ + name);
    } else if (fs::exists(name)) {
      show(name);
    }
  }
  show("/usr");
  show(KOVA_TEST_BINARY_DIR);
  show(volume());
  show(stage() + "/keys");
  fs::copy_file(configuration(), path_ + configuration());
  for (const std::string &folder : folders) {
    show(folder);
  }
}

void SmallRoot::show(const std::string &folder) const {
  fs::create_directories(path_ + folder);
  need(::mount(folder.c_str(), (path_ + folder).c_str(), nullptr, MS_BIND | MS_REC, nullptr) == 0,
       folder + " cannot be bound");
}

void SmallRoot::enter() const {
  need(::chroot(path_.c_str()) == 0 && ::chdir("/") == 0, "chroot");
}

} // namespace KovaTest::Hostile
