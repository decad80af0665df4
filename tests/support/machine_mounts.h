#ifndef KOVABACKUP_TESTS_MACHINE_MOUNTS_H
#define KOVABACKUP_TESTS_MACHINE_MOUNTS_H

/// @file The machine's own mounts, for configurations of the stand-ins that must not use them as
/// volumes.

#include <cstdio>
#include <gtest/gtest.h>
#include <json/json.h>
#include <mntent.h>
#include <string>

namespace KovaTest {

/// The mount points, as a JSON list on one line: the value of "exclude" in section [mounts].
inline std::string machineMounts() {
  Json::Value paths(Json::arrayValue);
  std::FILE *const table = ::setmntent("/proc/self/mounts", "re");
  EXPECT_NE(nullptr, table);
  while (const mntent *entry = table != nullptr ? ::getmntent(table) : nullptr) {
    paths.append(entry->mnt_dir);
  }
  if (table != nullptr) {
    ::endmntent(table);
  }
  Json::StreamWriterBuilder oneLine;
  oneLine["indentation"] = "";
  return Json::writeString(oneLine, paths);
}

} // namespace KovaTest

#endif
