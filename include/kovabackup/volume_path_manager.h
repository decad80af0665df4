#ifndef KOVABACKUP_VOLUME_PATH_MANAGER_H
#define KOVABACKUP_VOLUME_PATH_MANAGER_H

/// @file Choosing the storage volume on which temporary data is to live.
///
///     boost::shared_ptr<FilterVolume> filter(new FilterMaxExtVolume(true));
///     std::string dir;
///     if (!VolumePathManager::getInstance().getVolumePath(filter, dir)) return false;
///     ...make files in dir: the share temporary directory of the largest ext volume, or "/tmp"...
///
/// A filter is a rule. The manager enumerates the mounted volumes with the filter's two arguments,
/// offers those that are usable to isAccept one after the other, and takes the share temporary
/// directory of the last one that was accepted; when none was, the filter's defaultPath decides.
/// What it found is remembered under the filter's signature until the process ends: a success is
/// never looked up again, a failure always. So a fallback to "/tmp" stays even when a volume
/// appears later; this is deliberate: one stable place per rule and process.
///
/// A rule of one's own derives from FilterVolume. Equal signatures must select equal directories.
///
/// Ownership: the manager creates nothing on disk and owns nothing but its memory of results;
///            filters are shared through boost::shared_ptr.
/// Failure:   by return value; nothing is thrown but std::bad_alloc and what a derived filter's own
///            operations throw (the enumeration is freed then, too).
/// errno:     not meaningful.
/// Log:       under the module path "temp_manager/volume_path_manager".
/// Threads:   no locks. One thread at a time may use the manager, and a filter while it is ranked;
///            only the first getInstance() may be called by several threads at once.
/// Process:   the memory of results is the process's; a forked child inherits a copy.

#include <boost/shared_ptr.hpp>
#include <cstdint>
#include <map>
#include <string>

#pragma GCC visibility push(default)

/// The platform's record of one mounted volume (kovaplatform/kovasdk.h).
struct KOVAVOLInfo;

namespace KOVA {
namespace Backup {

/// A rule that chooses a volume.
class FilterVolume {
public:
  virtual ~FilterVolume();

  /// Tells with which arguments the platform is to enumerate the volumes: here the locations that
  /// the machine supports, and 1.
  /// Returns: true with both set; false with both untouched when the platform supports no location.
  ///          On false nothing is enumerated and defaultPath decides.
  virtual bool getVolumeEnumParameter(int &location, int &enumFlags) const;

  /// Judges one volume; keeps what it needs to compare the next one with.
  /// Returns: true when the volume is better than all accepted before.
  virtual bool isAccept(const KOVAVOLInfo &info) = 0;

  /// The directory for the case that no volume was accepted: here "", that is, failure.
  virtual std::string defaultPath() const;

  /// Identifies the rule with all its arguments: the key under which a result is remembered.
  virtual std::string getSignature() const = 0;
};

/// The largest volume, of any file system.
///
/// The largest size accepted is kept for the life of the object: a volume is accepted only when it
/// is strictly larger than every one accepted before, in an earlier enumeration too. So of equal
/// volumes the first wins, and one of size 0 never does.
class FilterMaxVolume : public FilterVolume {
public:
  /// Enumerates with the platform's own arguments (with 0 and 0 when it supports no location) and
  /// has no fallback.
  FilterMaxVolume();

  /// Likewise; with fallbackTmp, "/tmp" is the fallback.
  explicit FilterMaxVolume(bool fallbackTmp);

  /// Enumerates with the given location mask and flags.
  FilterMaxVolume(int location, int enumFlags, bool fallbackTmp);

  ~FilterMaxVolume() override;

  /// Returns: always true, with the object's own arguments.
  bool getVolumeEnumParameter(int &location, int &enumFlags) const override;
  bool isAccept(const KOVAVOLInfo &info) override;
  std::string defaultPath() const override;

  /// Returns: "FilterMaxVolume:<location>:<enumFlags>:<0 or 1>", for example
  /// "FilterMaxVolume:5:2:0".
  std::string getSignature() const override;

private:
  int location_;
  int enumFlags_;
  bool fallbackTmp_;
  std::uint64_t maxSize_;
};

/// The largest volume with an ext file system (type codes 1 and 2); else as FilterMaxVolume. A
/// volume of another type is rejected whatever its size, and its size does not count.
class FilterMaxExtVolume : public FilterVolume {
public:
  FilterMaxExtVolume();
  explicit FilterMaxExtVolume(bool fallbackTmp);
  FilterMaxExtVolume(int location, int enumFlags, bool fallbackTmp);
  ~FilterMaxExtVolume() override;

  bool getVolumeEnumParameter(int &location, int &enumFlags) const override;
  bool isAccept(const KOVAVOLInfo &info) override;
  std::string defaultPath() const override;

  /// Returns: "FilterMaxExtVolume:<location>:<enumFlags>:<0 or 1>".
  std::string getSignature() const override;

private:
  int location_;
  int enumFlags_;
  bool fallbackTmp_;
  std::uint64_t maxSize_;
};

/// The largest volume with an ext or btrfs file system (type codes 1, 2 and 3); else as
/// FilterMaxExtVolume.
class FilterMaxExtBtrfsVolume : public FilterVolume {
public:
  FilterMaxExtBtrfsVolume();
  explicit FilterMaxExtBtrfsVolume(bool fallbackTmp);
  FilterMaxExtBtrfsVolume(int location, int enumFlags, bool fallbackTmp);
  ~FilterMaxExtBtrfsVolume() override;

  bool getVolumeEnumParameter(int &location, int &enumFlags) const override;
  bool isAccept(const KOVAVOLInfo &info) override;
  std::string defaultPath() const override;

  /// Returns: "FilterMaxExtBtrfsVolume:<location>:<enumFlags>:<0 or 1>".
  std::string getSignature() const override;

private:
  int location_;
  int enumFlags_;
  bool fallbackTmp_;
  std::uint64_t maxSize_;
};

/// The volume that holds a given path. Nothing is enumerated: the directory is the fallback's.
class FilterSameVolume : public FilterVolume {
public:
  /// Asks the platform for the volume that holds path.
  /// Log: one LOG_ERR line (30) when it knows none; the filter is usable then, and resolves to
  ///      nothing.
  explicit FilterSameVolume(const std::string &path);
  ~FilterSameVolume() override;

  /// Returns: always false; the arguments stay untouched.
  bool getVolumeEnumParameter(int &location, int &enumFlags) const override;

  /// Returns: always false.
  bool isAccept(const KOVAVOLInfo &info) override;

  /// Returns: the share temporary directory of the path's volume, "" when there is none.
  /// Log:     one LOG_ERR line (19) when the platform cannot name the directory.
  std::string defaultPath() const override;

  /// Returns: "FilterSameVolume:<mount path of the volume>", the mount path empty when unknown.
  std::string getSignature() const override;

private:
  std::string volumePath_;
};

/// Resolves filters to directories and remembers the results. One object per process.
class VolumePathManager {
public:
  /// Returns: the process's manager, made by the first call.
  static VolumePathManager &getInstance();

  VolumePathManager(const VolumePathManager &) = delete;
  VolumePathManager &operator=(const VolumePathManager &) = delete;

  /// Resolves the filter to a directory in which temporary files may be made.
  /// Returns: true with path set; false with path empty (untouched when filter is null).
  /// Errors:  filter is null; no usable volume was accepted and the filter has no fallback. Usable
  ///          is a volume that both its status words call so, with a share temporary directory in
  ///          which the caller may write.
  /// Log:     one LOG_ERR line (19) for each volume whose share temporary directory the platform
  ///          cannot name; else none.
  /// Blocks:  for one enumeration of the volumes, unless a directory is remembered.
  bool getVolumePath(boost::shared_ptr<FilterVolume> filter, std::string &path);

private:
  VolumePathManager();
  ~VolumePathManager();

  std::map<std::string, std::string> volumePathCache_;
};

} // namespace Backup
} // namespace KOVA

#pragma GCC visibility pop

#endif
