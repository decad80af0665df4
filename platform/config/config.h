#ifndef KOVAPLATFORM_CONFIG_CONFIG_H
#define KOVAPLATFORM_CONFIG_CONFIG_H

/// @file The configuration file of the platform stand-ins.
///
///     Config config;
///     if (!loadConfig(config)) return -1;      // recorded and logged
///     if (!config.secretKeyFile.empty()) ...
///
/// None is needed. The file is /etc/kovaplatform/platform.conf, or the one that the environment
/// variable KOVA_PLATFORM_CONF names (not heeded in a program that runs with raised privileges; an
/// empty value names none). It has the section-file format, and every value is a JSON text:
///
///     # data that lies on the system disk
///     [volume data]
///     path="/srv/data"        required: absolute path of a directory
///     fsType=2                the number that the volume's record gets, 0 or more
///     size=1000000000         total bytes
///     removable=false
///
///     [mounts]
///     exclude=["/mnt/scratch"]    mount paths that are no volumes
///
///     [secret]
///     keyFile="/etc/kovaplatform/secret.key"
///
/// What is not set under [volume NAME] is that of the file system on which the directory lies. As
/// in every section file, lines, keys and values are trimmed of space, tab, line feed and carriage
/// return, a key that begins with # makes a comment, and a key given twice takes its last value.
///
/// Everything else is an error, since a slip that is passed over moves data to the wrong disk: an
/// unknown section or key, a section given twice, a line without '=' that is neither blank nor a
/// comment, a value of the wrong type, a volume without path. So is a file that is not there
/// although KOVA_PLATFORM_CONF names it, one that is no regular file, and one that group or others
/// may write.
///
/// Failure:   by return value; the code (KOVA_CONF_ERR_* of kovasdk.h), the file's path and the
/// line
///            in it stand in the error record, and in the system log with what is wrong.
/// Threads:   any. The file is read afresh by every call.
/// errno:     not meaningful.

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace KovaPlatform {

struct NamedVolume {
  std::string name;
  std::string path; ///< absolute, without slash at its end unless it is "/"
  std::optional<std::int32_t> fsType;
  std::optional<std::uint64_t> size;
  std::optional<bool> removable;
};

struct Config {
  std::vector<NamedVolume> volumes;       ///< in file order
  std::vector<std::string> mountExcludes; ///< without slash at their ends
  std::string secretKeyFile;              ///< absolute; "" when not set
};

/// What is wrong with a configuration text, and where. Line 0: the file as a whole.
struct ConfigError {
  int code = 0;
  int line = 0;
  std::string what;
};

/// Reads the configuration; without a file it is an empty one.
/// Returns: true with config filled; on false config is as it was.
/// Errors:  KOVA_CONF_ERR_*.
/// Log:     one LOG_ERR line "kovaplatform: <file>:<line>: <what is wrong>" on false.
bool loadConfig(Config &config) noexcept;

/// Reads a configuration text. May throw std::bad_alloc.
/// Returns: true with config filled; on false config is as it was and error is set.
bool parseConfig(const std::string &text, Config &config, ConfigError &error);

/// Path of the configuration file that loadConfig reads.
std::string configPath();

} // namespace KovaPlatform

#endif
