#ifndef KOVAPLATFORM_CONFIG_CONFIG_H
#define KOVAPLATFORM_CONFIG_CONFIG_H

/// @file The configuration file of the platform stand-ins.
///
///     Config config;
///     if (!loadConfig(config)) return -1;      // the error is recorded and logged
///     if (!config.secretKeyFile.empty()) ...
///
/// The file is optional. Its path is /etc/kovaplatform/platform.conf, or the value of the
/// environment variable KOVA_PLATFORM_CONF. The variable is ignored when it is empty, and in a
/// program that runs with raised privileges. The file is a section file, and every value is a JSON
/// text:
///
///     # data on the system disk
///     [volume data]
///     path="/srv/data"        required: absolute path of a directory
///     fsType=2                file system number in the volume's record, 0 or more
///     size=1000000000         total bytes
///     removable=false
///
///     [mounts]
///     exclude=["/mnt/scratch"]    mount paths that are not volumes
///
///     [secret]
///     keyFile="/etc/kovaplatform/secret.key"
///
/// What a [volume NAME] section does not set is taken from the file system that holds the
/// directory. As in every section file (base/section_grammar.h), space, tab, line feed and carriage
/// return are trimmed from lines, keys and values, a line that begins with # is a comment, and the
/// last value of a repeated key counts.
///
/// Everything else is an error, because a mistake that is passed over would move data to the wrong
/// disk: an unknown section or key, a section that occurs twice, a header without its ']', a line
/// without '=' that is neither blank nor a comment, a NUL in an option, a value of the wrong type,
/// a volume without a path. It is also an error if the file that KOVA_PLATFORM_CONF names does not
/// exist, if the file is not a regular file, if group or others may write it, or if it has more
/// than 1 MiB.
///
/// Failure:   by return value. The error record gets the code (KOVA_CONF_ERR_* of kovasdk.h), the
///            path of the file and the line in it; the system log also says what is wrong. When
///            memory runs out, the record names the source file instead.
/// Threads:   any. Every call reads the file again.
/// errno:     not meaningful.

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace KovaPlatform {

struct NamedVolume {
  std::string name;
  std::string path; ///< absolute, without a trailing slash unless it is "/"
  std::optional<std::int32_t> fsType;
  std::optional<std::uint64_t> size;
  std::optional<bool> removable;
};

struct Config {
  std::vector<NamedVolume> volumes;       ///< in file order
  std::vector<std::string> mountExcludes; ///< without trailing slashes
  std::string secretKeyFile;              ///< absolute; "" when not set
};

/// What is wrong with a configuration, and where. Line 0: not a line but the file itself.
struct ConfigError {
  int code = 0;
  int line = 0;
  std::string what;
};

/// Reads the configuration, which is empty if there is no file.
/// Returns: true with config filled; on false config is unchanged.
/// Errors:  KOVA_CONF_ERR_*.
/// Log:     one LOG_ERR line "kovaplatform: <file>:<line>: <what is wrong>" on false, without the
///          line number if the file itself is wrong.
bool loadConfig(Config &config) noexcept;

/// As loadConfig, for callers that report a failure themselves: nothing is recorded or logged. May
/// throw std::bad_alloc.
/// Returns: true with config filled; on false config is unchanged and error is set.
bool readConfig(Config &config, ConfigError &error);

/// Reads a configuration text. May throw std::bad_alloc.
/// Returns: true with config filled; on false config is unchanged and error is set.
bool parseConfig(const std::string &text, Config &config, ConfigError &error);

/// The path of the file that loadConfig reads.
std::string configPath();

/// Path of the master key's file: the one that the configuration names, or
/// /var/lib/kovaplatform/secret.key.
std::string secretKeyPath(const Config &config);

} // namespace KovaPlatform

#endif
