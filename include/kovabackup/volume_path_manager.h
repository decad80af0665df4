#ifndef KOVABACKUP_VOLUME_PATH_MANAGER_H
#define KOVABACKUP_VOLUME_PATH_MANAGER_H

/// @file Choosing the storage volume for temporary data.
///
///     boost::shared_ptr<FilterVolume> filter(new FilterMaxExtVolume(true));
///     std::string dir;
///     if (!VolumePathManager::getInstance().getVolumePath(filter, dir)) return false;
///     ...use dir: the share temporary directory of the largest ext volume, or "/tmp"...
///
/// A filter is a rule that chooses a volume. The manager enumerates the mounted volumes with the
/// two arguments that the filter supplies, and offers each usable volume to isAccept. The result is
/// the share temporary directory of the last volume that isAccept accepted. If none was accepted,
/// the filter's defaultPath is the result.
/// The manager caches each result under the filter's signature until the process ends. A successful
/// result is never looked up again; a failed lookup is always repeated. So a fallback to "/tmp"
/// remains in effect even when a volume appears later. This is deliberate: each rule keeps one
/// stable place for the lifetime of the process.
///
/// To write a rule of your own, derive from FilterVolume. Equal signatures must select equal
/// directories.
///
/// Ownership: the manager creates nothing on disk and owns only its cache. Filters are shared
///            through boost::shared_ptr.
/// Failure:   by return value. Only std::bad_alloc is thrown, and whatever the functions of a
///            derived filter throw; the enumeration is freed in both cases.
/// errno:     not meaningful.
/// Log:       under the module path "temp_manager/volume_path_manager".
/// Threads:   nothing is locked. One thread at a time may use the manager, or a filter that it
///            ranks. Only the first getInstance() may be called by several threads at the same
///            time.
/// Signals:   no function here is async-signal-safe.
/// Process:   the cache belongs to the process; a forked child inherits a copy.

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
  /// Filters are destroyed through boost::shared_ptr<FilterVolume>.
  virtual ~FilterVolume();

  /// Supplies the two arguments with which the platform enumerates the volumes. This implementation
  /// sets location to the mask of the locations that the machine supports, and enumFlags to 1.
  /// Returns: true with both set; false with both unchanged when the platform supports no location.
  ///          On false nothing is enumerated, and defaultPath decides.
  virtual bool getVolumeEnumParameter(int &location, int &enumFlags) const;

  /// Compares one volume with those accepted before, and stores what it needs for the next
  /// comparison. The record is valid only during the call.
  /// Returns: true when the volume is better than all volumes accepted before.
  virtual bool isAccept(const KOVAVOLInfo &info) = 0;

  /// The directory to use when no volume was accepted. This implementation returns "", which means
  /// that there is none.
  virtual std::string defaultPath() const;

  /// Identifies the rule together with all its arguments. The manager caches results under this
  /// text.
  virtual std::string getSignature() const = 0;
};

/// The largest volume, of any file system.
///
/// The object keeps the largest size that it has accepted: it accepts a volume only if it is
/// strictly larger than every volume accepted before, in earlier enumerations as well. So of
/// equally large volumes the first one wins, and a volume of size 0 never does.
class FilterMaxVolume : public FilterVolume {
public:
  /// Enumerates with the platform's own arguments, or with 0 and 0 when the platform supports no
  /// location. There is no fallback.
  FilterMaxVolume();

  /// Enumerates in the same way. With fallbackTmp, "/tmp" is the fallback.
  explicit FilterMaxVolume(bool fallbackTmp);

  /// Enumerates with the given location mask and flags, whose meaning the platform defines.
  FilterMaxVolume(int location, int enumFlags, bool fallbackTmp);

  ~FilterMaxVolume() override;

  /// Returns: always true, with the object's own arguments.
  bool getVolumeEnumParameter(int &location, int &enumFlags) const override;

  /// Returns: true when the volume is larger than all volumes accepted before.
  bool isAccept(const KOVAVOLInfo &info) override;

  /// Returns: "/tmp" with fallbackTmp, otherwise "".
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

/// The largest volume with an ext file system (type codes 1 and 2). A volume of another type is
/// rejected whatever its size, and its size is not recorded. In every other respect the class
/// behaves like FilterMaxVolume.
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

/// The largest volume with an ext or btrfs file system (type codes 1, 2 and 3). In every other
/// respect the class behaves like FilterMaxExtVolume.
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

/// The volume that holds a given path. Nothing is enumerated; defaultPath returns the directory.
class FilterSameVolume : public FilterVolume {
public:
  /// Asks the platform for the volume that holds path.
  /// Log: one LOG_ERR line, 30, when the platform finds none. The filter is usable nevertheless,
  ///      and resolves to nothing.
  explicit FilterSameVolume(const std::string &path);
  ~FilterSameVolume() override;

  /// Returns: always false, with both arguments unchanged.
  bool getVolumeEnumParameter(int &location, int &enumFlags) const override;

  /// Returns: always false.
  bool isAccept(const KOVAVOLInfo &info) override;

  /// Returns: the share temporary directory of the path's volume; "" when there is none.
  /// Log:     one LOG_ERR line, 19, when the platform cannot supply the directory.
  std::string defaultPath() const override;

  /// Returns: "FilterSameVolume:<mount path of the volume>". The mount path is empty when the
  ///          volume is unknown.
  std::string getSignature() const override;

private:
  std::string volumePath_;
};

/// Resolves filters to directories and caches the results. Each process has one manager.
class VolumePathManager {
public:
  /// Returns: the manager of the process, which the first call creates.
  /// Threads: any; concurrent first calls create one manager.
  static VolumePathManager &getInstance();

  VolumePathManager(const VolumePathManager &) = delete;
  VolumePathManager &operator=(const VolumePathManager &) = delete;

  /// Resolves the filter to a directory in which temporary files may be created.
  /// Returns: true with path set; false with path empty, or unchanged when filter is null.
  /// Errors:  filter is null; no usable volume was accepted and the filter has no fallback. A
  ///          volume is usable if both of its status words are non-zero and it has a share
  ///          temporary directory in which the caller may write.
  /// Log:     one LOG_ERR line, 19, for each volume whose share temporary directory the platform
  ///          cannot supply; otherwise nothing.
  /// Blocks:  for one enumeration of the volumes, unless the result is cached.
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
