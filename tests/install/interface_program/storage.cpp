#include "check.h"

#include <kovabackup/session.h>
#include <kovabackup/temp_manager.h>
#include <kovabackup/volume_path_manager.h>
#include <kovaplatform/kovasdk.h>

#include <string>
#include <unistd.h>

using namespace KOVA::Backup;

namespace {

// The volume that the program's configuration names, and a folder on it.
const char *const kVolume = "/mnt";
const char *const kOnVolume = "/mnt/music";

using Filter = boost::shared_ptr<FilterVolume>;

bool exists(const std::string &path) {
  return ::access(path.c_str(), F_OK) == 0;
}

bool isOnVolume(const std::string &path) {
  return path.compare(0, std::string(kVolume).size() + 1, std::string(kVolume) + "/") == 0;
}

// A rule that a caller derives, with only the functions that it must define.
class OwnRule : public FilterVolume {
public:
  bool isAccept(const KOVAVOLInfo &info) override { return info.fsType == -1; }
  std::string getSignature() const override { return "OwnRule"; }
};

void callOwnRule() {
  const OwnRule rule;
  int location = -1;
  int enumFlags = -1;
  (void)rule.FilterVolume::getVolumeEnumParameter(location, enumFlags);
  check(rule.FilterVolume::defaultPath().empty(), "FilterVolume::defaultPath");
}

template <typename Rule>
void callMaxRule(const std::string &name) {
  check(!Rule().getSignature().empty(), "a rule's constructor without arguments");
  check(Rule(true).defaultPath() == "/tmp", "a rule's constructor with a fallback");
  Rule rule(5, 2, false);
  check(rule.getSignature() == name + ":5:2:0", "a rule's constructor and getSignature");
  int location = 0;
  int enumFlags = 0;
  check(rule.getVolumeEnumParameter(location, enumFlags) && location == 5 && enumFlags == 2,
        "a rule's getVolumeEnumParameter");
  KOVAVOLInfo info = {};
  info.fsType = 2; // ext4
  info.size = 1;
  check(rule.isAccept(info), "a rule's isAccept");
}

void callSameRule() {
  FilterSameVolume rule(kOnVolume);
  check(!rule.getSignature().empty(), "FilterSameVolume::getSignature");
  int location = 0;
  int enumFlags = 0;
  (void)rule.getVolumeEnumParameter(location, enumFlags);
  (void)rule.defaultPath();
  KOVAVOLInfo info = {};
  check(!rule.isAccept(info), "FilterSameVolume::isAccept");
}

void callManager() {
  check(TempManager::maxVolume() && TempManager::maxVolume(true) &&
            TempManager::maxVolume(5, 2, false),
        "maxVolume");
  check(TempManager::maxExtVolume() && TempManager::maxExtVolume(true) &&
            TempManager::maxExtVolume(5, 2, false),
        "maxExtVolume");
  check(TempManager::maxExtBtrfsVolume() && TempManager::maxExtBtrfsVolume(true) &&
            TempManager::maxExtBtrfsVolume(5, 2, false),
        "maxExtBtrfsVolume");
  std::string dir;
  check(VolumePathManager::getInstance().getVolumePath(TempManager::sameVolume(kOnVolume), dir) &&
            isOnVolume(dir),
        "sameVolume and getVolumePath");
}

void callTempFile() {
  ScopedTempFile file;
  check(!file.isValid() && file.create("/tmp/interface") && file.isValid(),
        "ScopedTempFile::create");
  check(exists(file.getPath()) && file.getFileDescripter() >= 0, "ScopedTempFile's file");
  file.close();
  check(file.getFileDescripter() == -1, "ScopedTempFile::close");
  check(file.rename("/tmp/interface.file"), "ScopedTempFile::rename");
  ScopedTempFile closed("/tmp/interface", true);
  check(closed.getFileDescripter() == -1, "ScopedTempFile with a name");
  const std::string kept = closed.preserve();
  check(exists(kept) && ::unlink(kept.c_str()) == 0, "ScopedTempFile::preserve");
  ScopedVolumeTempFile onVolume(TempManager::sameVolume(kOnVolume), "interface", true);
  const std::string path = onVolume.getPath();
  check(isOnVolume(path) && exists(path), "ScopedVolumeTempFile");
  onVolume.unlink();
  check(!exists(path), "ScopedTempFile::unlink");
}

void callTempFolder() {
  ScopedTempFolder folder;
  check(!folder.isValid() && folder.create("/tmp/interface") && folder.isValid() &&
            exists(folder.getPath()),
        "ScopedTempFolder::create");
  check(folder.rename("/tmp/interface.folder"), "ScopedTempFolder::rename");
  ScopedTempFolder named("/tmp/interface");
  const std::string kept = named.preserve();
  check(exists(kept) && ::rmdir(kept.c_str()) == 0, "ScopedTempFolder::preserve");
  ScopedVolumeTempFolder onVolume(TempManager::sameVolume(kOnVolume), "interface");
  const std::string path = onVolume.getPath();
  check(isOnVolume(path) && exists(path), "ScopedVolumeTempFolder");
  onVolume.unlink();
  check(!exists(path), "ScopedTempFolder::unlink");
}

void callSession() {
  Session local;
  check(local.create() && exists(local.getPath()), "Session::create");
  check(Session::getPathById(local.getId()) == local.getPath(), "Session::getPathById");
  Session again;
  check(again.load(local.getId()) && again.destroy() && !exists(local.getPath()),
        "Session::load and destroy");
  Session onVolume;
  check(onVolume.create(TempManager::sameVolume(kOnVolume)) && isOnVolume(onVolume.getPath()),
        "Session::create on a volume");
  check(Session::destroyById(onVolume.getId()) && !exists(onVolume.getPath()),
        "Session::destroyById");
}

} // namespace

void callStorage() {
  callOwnRule();
  callMaxRule<FilterMaxVolume>("FilterMaxVolume");
  callMaxRule<FilterMaxExtVolume>("FilterMaxExtVolume");
  callMaxRule<FilterMaxExtBtrfsVolume>("FilterMaxExtBtrfsVolume");
  callSameRule();
  callManager();
  callTempFile();
  callTempFolder();
  callSession();
}
