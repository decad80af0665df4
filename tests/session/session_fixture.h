#ifndef KOVABACKUP_TESTS_SESSION_FIXTURE_H
#define KOVABACKUP_TESTS_SESSION_FIXTURE_H

/// @file Shared by the tests of sessions: a volume outside /tmp, filters, and chosen names in place
/// of the random ones of mkdtemp.

#include "kovabackup/session.h"
#include "kovabackup/temp_manager.h"
#include "tests/session/volume_mount.h"
#include "tests/support/fault.h"
#include "tests/support/files.h"
#include "tests/support/log_capture.h"
#include "tests/temp_manager/fake_volumes.h"

#include <boost/make_shared.hpp>
#include <gmock/gmock.h>
#include <new>
#include <string>

namespace KovaTest {

/// The fixture of tests with an empty volume outside /tmp.
class Sessions : public testing::Test {
protected:
  void SetUp() override {
    if (!volume.failure.empty()) {
      GTEST_SKIP() << volume.failure;
    }
  }

  VolumeMount volume;
};

constexpr const char *kSessionRoot = "/tmp/kovabackup/session";

/// The path of a local session or of the link of a volume session.
inline std::string linkOf(const std::string &id) {
  return std::string(kSessionRoot) + "/" + id;
}

inline void expectEmpty(const KOVA::Backup::Session &session) {
  EXPECT_EQ("", session.getId());
  EXPECT_EQ("", session.getPath());
}

/// A filter that no earlier test has used, for the volume of FakeVolumes.
inline boost::shared_ptr<KOVA::Backup::FilterVolume> anyVolume() {
  return KOVA::Backup::TempManager::maxVolume(freshLocation(), 1, false);
}

/// A filter that returns a directory unchanged and unchecked.
class FixedFilter : public KOVA::Backup::FilterVolume {
public:
  explicit FixedFilter(std::string dir) : dir_(std::move(dir)) {}
  bool getVolumeEnumParameter(int & /*location*/, int & /*enumFlags*/) const override {
    return false;
  }
  bool isAccept(const KOVAVOLInfo & /*info*/) override { return false; }
  std::string defaultPath() const override { return dir_; }
  std::string getSignature() const override { return "FixedFilter:" + dir_; }

private:
  const std::string dir_;
};

/// Creates a local session without a filter, one on its volume with a filter. std::bad_alloc counts
/// as failure.
inline bool createOrThrow(KOVA::Backup::Session &session,
                          const boost::shared_ptr<KOVA::Backup::FilterVolume> &filter) {
  try {
    return filter ? session.create(filter) : session.create();
  } catch (const std::bad_alloc &) {
    return false;
  }
}

/// For its lifetime, mkdtemp replaces XXXXXX with these six letters, even if that name exists.
class ChosenName {
public:
  explicit ChosenName(const char *letters);
  ~ChosenName();
  ChosenName(const ChosenName &) = delete;
  ChosenName &operator=(const ChosenName &) = delete;
};

} // namespace KovaTest

#endif
