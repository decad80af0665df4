// One step of the end-to-end test, in a separate process:
//   pick max|ext|extbtrfs        prints the temporary directory of the largest volume
//   same PATH                    prints the temporary directory of the volume that holds PATH
//   create TEXT                  creates a session on the largest ext or btrfs volume, stores TEXT
//                                in it and prints its id
//   show ID                      prints the path and the text of a session
//   destroy ID                   destroys a session
//   share PATH                   prints the name of the share that holds PATH
// Exits with 1 when the step fails.

#include "kovabackup/path_kova.h"
#include "kovabackup/session.h"
#include "kovabackup/temp_manager.h"
#include "kovabackup/volume_path_manager.h"

#include <fstream>
#include <iostream>
#include <iterator>
#include <string>

using namespace KOVA::Backup;

namespace {

boost::shared_ptr<FilterVolume> ruleOf(const std::string &name) {
  if (name == "max") {
    return TempManager::maxVolume();
  }
  return name == "ext" ? TempManager::maxExtVolume() : TempManager::maxExtBtrfsVolume();
}

bool pick(const boost::shared_ptr<FilterVolume> &filter) {
  std::string path;
  const bool found = VolumePathManager::getInstance().getVolumePath(filter, path);
  std::cout << path << '\n';
  return found;
}

bool create(const std::string &text) {
  Session session;
  if (!session.create(TempManager::maxExtBtrfsVolume())) {
    return false;
  }
  std::cout << session.getId() << '\n';
  return (std::ofstream(session.getPath() + "/note") << text << std::flush).good();
}

bool show(const std::string &id) {
  Session session;
  if (!session.load(id)) {
    return false;
  }
  std::ifstream note(session.getPath() + "/note");
  const std::string text(std::istreambuf_iterator<char>(note), {});
  std::cout << session.getPath() << ' ' << text << '\n';
  return Session::getPathById(id) == session.getPath();
}

bool share(const std::string &path) {
  const std::string name = Path::getShareName(path);
  std::cout << name << '\n';
  return !name.empty();
}

bool step(const std::string &verb, const std::string &argument) {
  if (verb == "pick") {
    return pick(ruleOf(argument));
  }
  if (verb == "same") {
    return pick(TempManager::sameVolume(argument));
  }
  if (verb == "create") {
    return create(argument);
  }
  if (verb == "show") {
    return show(argument);
  }
  if (verb == "share") {
    return share(argument);
  }
  return verb == "destroy" && Session::destroyById(argument);
}

} // namespace

int main(int argc, char **argv) {
  return argc == 3 && step(argv[1], argv[2]) ? 0 : 1;
}
