#ifndef KOVABACKUP_TESTS_FAULTS_WORLD_H
#define KOVABACKUP_TESTS_FAULTS_WORLD_H

/// @file The disk that scenarios see: a /tmp and a volume of their own, and a /proc that shows
/// their processes only.

#include <map>
#include <string>

namespace KovaTest::Faults {

/// The folder for the files of a scenario.
constexpr const char *kWork = "/tmp/scenario";
/// The key file of the platform's secrets. Made with the first secret.
constexpr const char *kKeyFile = "/tmp/scenario/keys/secret.key";
constexpr const char *kSessionRoot = "/tmp/kovabackup/session";

/// The volume's mount point, outside /tmp.
const std::string &volume();

/// Enters a world of its own. Returns: "" on success, otherwise why there is none.
std::string enterWorld();

/// Empties the disk, except for the work folder and the platform's configuration.
void resetWorld();

/// All files, folders and links: path -> content. A link's content is "-> TARGET". What
/// resetWorld makes is left out.
std::map<std::string, std::string> readWorld();

} // namespace KovaTest::Faults

#endif
