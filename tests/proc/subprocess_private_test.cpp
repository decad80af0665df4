// The private record of a command, and its one state that no operation reaches.

#include "proc/subprocess_private.h"

#include "tests/proc/launch_fixture.h"

#include <cstdlib>

using namespace KovaTest;
using KOVA::Backup::launchInChild;
using KOVA::Backup::StdRedirect;
using KOVA::Backup::SubProcessPrivate;

TEST(SubProcessRecord, BeginsWithoutRedirectionsAndWithAClearedEnvironment) {
  const SubProcessPrivate record;
  EXPECT_TRUE(record.args.empty());
  EXPECT_TRUE(record.envs.empty());
  for (const StdRedirect &redirect : {record.stdOut, record.stdErr}) {
    EXPECT_EQ(-1, redirect.fd);
    EXPECT_EQ("", redirect.path);
    EXPECT_EQ(0, redirect.mode);
  }
  EXPECT_TRUE(record.clearEnv);
}

class LaunchRecord : public Launch {};

TEST_F(LaunchRecord, KeepsTheEnvironmentWhenItIsNotToBeCleared) {
  EXPECT_EQ(0, runInChild([&] {
              ::setenv("KOVA_HOST_VARIABLE", "kept", 1);
              ::setenv("NAME", "old", 1);
              SubProcessPrivate record;
              record.args = helperArgs({"report", file("report")});
              record.envs["NAME"] = "new";
              record.clearEnv = false;
              (void)launchInChild(record);
              return 1;
            }));
  const Report report = parseReport(readFile(file("report")));
  EXPECT_EQ("kept", report.at("env KOVA_HOST_VARIABLE"));
  EXPECT_EQ("new", report.at("env NAME"));
}
