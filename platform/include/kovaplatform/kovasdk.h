#ifndef KOVAPLATFORM_KOVASDK_H
#define KOVAPLATFORM_KOVASDK_H

/**
 * @file
 * The platform's storage services: mounted volumes and shares.
 *
 *     KOVAVOLInfo *list = KOVAMountVolAllEnum(0, KOVAVolumeSupportLocGet(), KOVA_VOL_ENUM_MOUNTED);
 *     for (const KOVAVOLInfo *volume = list; volume != NULL; volume = volume->next)
 *       printf("%s: %llu bytes\n", volume->mountPath, (unsigned long long)volume->size);
 *     KOVAMountVolInfoFree(list);
 *
 * A volume is a mounted file system that holds data, or a directory that the configuration names
 * (below). The file systems are those on a disk or a pool (ext2, ext3, ext4, btrfs, xfs, f2fs, zfs,
 * ntfs, exfat, vfat). The system's own mounts are not volumes: /, /efi, /usr, /var and /tmp
 * themselves, every path that begins with /boot, and everything at or below /var/log, /var/tmp and
 * the directories of snaps and containers (/snap, /var/lib/docker and the like).
 *
 * Each file system is one volume, however often it is mounted or bound. It is represented by the
 * first mount that shows its root directory or, if none does (subvolumes), by its first mount. If
 * that mount is one of the system's, the file system is not a volume, even if it is mounted
 * elsewhere too.
 *
 * A mount path longer than 35 bytes does not fit into a KOVAVOLInfo. If the file system has another
 * mount, that one is used instead; otherwise the volume is left out of lists, with a warning in the
 * system log, and KOVAMountVolInfoGet fails. KOVAShareTmpPathGet and KOVAShareNamePathGet still
 * work.
 *
 * This implementation is the stand-in for an appliance's own library. Every call reads the mount
 * table of the process, sysfs and the configuration file. The configuration file is optional. It is
 * /etc/kovaplatform/platform.conf, or the file that the environment variable KOVA_PLATFORM_CONF
 * names, in the section-file format with JSON values:
 *
 *     [volume data]              # makes a directory a volume, on any file system; needed on a
 *     path="/srv/data"           # machine that has only a root file system
 *     fsType=2                   # default of these three: the file system's own
 *     size=1000000000
 *     removable=false
 *     [mounts]
 *     exclude=["/mnt/scratch"]   # mount paths that are not volumes
 *     [secret]
 *     keyFile="/etc/kovaplatform/secret.key"
 *
 * In the file itself a comment must be on a line of its own. An error in the file makes every call
 * that reads it fail.
 *
 * Failure:   by return value; the error record (KLIBCErrGet) has one of the codes below. Outputs
 *            are unchanged on failure.
 * errno:     not meaningful.
 * Log:       LOG_ERR for an error in the configuration and for an unreadable mount table; anything
 *            else is documented with the function.
 * Threads:   any; calls are independent.
 * Process:   no state, except that the warning about a machine without volumes is logged only once.
 *            Descriptors are close-on-exec.
 */

#include <stddef.h>
#include <stdint.h>

/**
 * Error codes. They are specific to the stand-in.
 *
 *     code    name                       what happened
 *     0x3001  KOVA_SDK_ERR_ARGUMENT      a null argument, an empty mountPath, or reserved is not 0
 *     0x3002  KOVA_SDK_ERR_NO_MEMORY     memory ran out
 *     0x3003  KOVA_SDK_ERR_MOUNTS        the mount table cannot be read
 *     0x3004  KOVA_SDK_ERR_PATH          the path cannot be resolved
 *     0x3005  KOVA_SDK_ERR_NO_VOLUME     the path is not on a volume, or not the mount path of one
 *     0x3006  KOVA_SDK_ERR_TOO_LONG      the volume's mount path does not fit the record
 *     0x3007  KOVA_SDK_ERR_TOO_SMALL     a buffer is too small for its text
 *     0x3008  KOVA_SDK_ERR_TMP_DIR       the share temporary directory cannot be created or given
 *                                        its mode, something else is in its place, or the volume
 *                                        has just been unmounted
 *     0x3009  KOVA_SDK_ERR_NO_SHARE      the path is not in a share
 *     0x300A  KOVA_SDK_ERR_SIZE          the size of the file system cannot be read
 *     0x3101  KOVA_CONF_ERR_OPEN         the configuration file cannot be opened or read
 *     0x3102  KOVA_CONF_ERR_UNSAFE       it is not a regular file, or group or others may write it
 *     0x3103  KOVA_CONF_ERR_SYNTAX       a line is neither blank, comment, header nor key=value
 *     0x3104  KOVA_CONF_ERR_SECTION      unknown section
 *     0x3105  KOVA_CONF_ERR_KEY          unknown key, or an option before the first section
 *     0x3106  KOVA_CONF_ERR_VALUE        a value is not a JSON text or has the wrong type
 *     0x3107  KOVA_CONF_ERR_NO_PATH      a volume has no path
 *     0x3108  KOVA_CONF_ERR_TWICE        a section occurs twice
 *     0x3109  KOVA_CONF_ERR_NO_MEMORY    memory ran out while the configuration was read
 *
 * With a KOVA_CONF_ERR_* code other than NO_MEMORY, file and line of the error record are the path
 * of the configuration file and the line in it, or 0 for the file itself. Every service that needs
 * the configuration may fail with one of these codes.
 */
#define KOVA_SDK_ERR_ARGUMENT 0x3001
#define KOVA_SDK_ERR_NO_MEMORY 0x3002
#define KOVA_SDK_ERR_MOUNTS 0x3003
#define KOVA_SDK_ERR_PATH 0x3004
#define KOVA_SDK_ERR_NO_VOLUME 0x3005
#define KOVA_SDK_ERR_TOO_LONG 0x3006
#define KOVA_SDK_ERR_TOO_SMALL 0x3007
#define KOVA_SDK_ERR_TMP_DIR 0x3008
#define KOVA_SDK_ERR_NO_SHARE 0x3009
#define KOVA_SDK_ERR_SIZE 0x300A
#define KOVA_CONF_ERR_OPEN 0x3101
#define KOVA_CONF_ERR_UNSAFE 0x3102
#define KOVA_CONF_ERR_SYNTAX 0x3103
#define KOVA_CONF_ERR_SECTION 0x3104
#define KOVA_CONF_ERR_KEY 0x3105
#define KOVA_CONF_ERR_VALUE 0x3106
#define KOVA_CONF_ERR_NO_PATH 0x3107
#define KOVA_CONF_ERR_TWICE 0x3108
#define KOVA_CONF_ERR_NO_MEMORY 0x3109

/** Kinds of file systems in a volume's record. 1 to 3 are the platform's; the others are
 *  specific to the stand-in. */
#define KOVA_VOL_FS_OTHER 0 /**< any other; only for a directory that the configuration names */
#define KOVA_VOL_FS_EXT 1   /**< ext2 and ext3 */
#define KOVA_VOL_FS_EXT4 2
#define KOVA_VOL_FS_BTRFS 3
#define KOVA_VOL_FS_XFS 4
#define KOVA_VOL_FS_F2FS 5
#define KOVA_VOL_FS_ZFS 6
#define KOVA_VOL_FS_NTFS 7
#define KOVA_VOL_FS_EXFAT 8
#define KOVA_VOL_FS_VFAT 9

/** Bits of a location mask. A platform may define more. */
#define KOVA_VOL_LOC_INTERNAL 1
#define KOVA_VOL_LOC_REMOVABLE 2 /**< removable media, or a disk on USB */

/** Bits of enumFlags. */
#define KOVA_VOL_ENUM_MOUNTED 1   /**< mounted volumes only */
#define KOVA_VOL_ENUM_READ_ONLY 2 /**< read-only volumes as well */

#ifdef __cplusplus
extern "C" {
#endif

/* The platform's libraries export these names and no others. */
#pragma GCC visibility push(default)

/** One volume. The positions of the named fields are the contract between the platform and its
 *  callers; the bytes between them belong to the platform. */
typedef struct KOVAVOLInfo {
  unsigned char reserved0[12];
  int32_t fsType; /**< byte 12: KOVA_VOL_FS_* */
  unsigned char reserved16[32];
  uint32_t status;    /**< byte 48: non-zero while mounted */
  char mountPath[36]; /**< byte 52: NUL-terminated */
  uint64_t size;      /**< byte 88: total bytes, including those in use or reserved for root */
  unsigned char reserved96[8];
  uint32_t accessStatus; /**< byte 104: non-zero when writable */
  unsigned char reserved108[4];
  struct KOVAVOLInfo *next; /**< byte 112: next record of a list, null at its end */
} KOVAVOLInfo;

/** The part of the record that KOVAMountVolInfoGet fills. */
#define KOVA_VOL_INFO_FILLED_BYTES 112

/**
 * Returns the locations at which this machine has volumes now.
 *
 * Returns: a mask of KOVA_VOL_LOC_*; 0 when there are no volumes, or on failure. To tell these
 * apart, clear the error record before the call.
 */
int KOVAVolumeSupportLocGet(void);

/**
 * Lists the volumes whose location is in the mask: first the mounted ones in the order of the mount
 * table, then the directories that the configuration names, in the order of the file. Read-only
 * volumes are left out unless KOVA_VOL_ENUM_READ_ONLY is set. A configured directory that does not
 * exist counts as a volume that is not mounted: it is listed with status 0, unless
 * KOVA_VOL_ENUM_MOUNTED is set.
 *
 * reserved: must be 0.
 * location, enumFlags: bits that are not named above are ignored.
 * Returns: head of a list; null when there are no such volumes, or on failure.
 * Owns:    the caller frees the list with KOVAMountVolInfoFree.
 * Log:     LOG_WARNING for each volume that is left out because its mount path is too long or its
 *          size cannot be read, and once per process when the machine has no volumes at all.
 */
KOVAVOLInfo *KOVAMountVolAllEnum(int reserved, int location, int enumFlags);

/**
 * Describes the volume that holds path. Links, ".", ".." and bind mounts are resolved first: a path
 * on a bind mount belongs to the volume of the file system that is bound there.
 *
 * path:    must exist.
 * info:    only its first KOVA_VOL_INFO_FILLED_BYTES bytes are filled; the caller's buffer may end
 *          there.
 * Returns: 0 on success; -1 on failure.
 */
int KOVAMountVolInfoGet(const char *path, KOVAVOLInfo *info);

/** Frees a list that KOVAMountVolAllEnum returned. Null is allowed. */
void KOVAMountVolInfoFree(KOVAVOLInfo *list);

/**
 * Writes the path of a volume's share temporary directory, <mountPath>/.kova_tmp, into buf. Creates
 * the directory with mode 01777 if it does not exist, and changes the mode of an existing one to
 * that. If a link or a file is in its place, the call fails and leaves it unchanged. On a file
 * system that keeps no modes (ntfs, exfat, vfat) the mount options decide who may write.
 *
 * mountPath: as the other services return it. Any other directory is refused, so that nothing is
 *            written below the mount point of a volume that was unmounted in the meantime.
 * buf:       has room for size bytes, including the NUL. If that is too small, the call fails and
 *            creates nothing.
 * Returns: 0 on success; -1 on failure.
 */
int KOVAShareTmpPathGet(const char *mountPath, char *buf, int size);

/**
 * Writes the name and the path of the share that holds path. A share is a directory directly below
 * the mount path of a volume, unless its name begins with "." or "@". The path is resolved as in
 * KOVAMountVolInfoGet. With a volume at /volume1, "/volume1/music/a" and "/volume1/music" give
 * "music" and "/volume1/music"; "/volume1" and "/volume1/@eaDir/x" are not in a share.
 *
 * path:    must exist.
 * name, sharePath: have room for nameSize and sharePathSize bytes, including the NUL. If either is
 *                  too small, the call fails.
 * Returns: 0 on success; -1 on failure.
 */
int KOVAShareNamePathGet(const char *path, char *name, int nameSize, char *sharePath,
                         int sharePathSize);

#pragma GCC visibility pop

#ifdef __cplusplus
}
#define KOVAPLATFORM_STATIC_ASSERT(condition, text) static_assert(condition, text)
#else
#define KOVAPLATFORM_STATIC_ASSERT(condition, text) _Static_assert(condition, text)
#endif

KOVAPLATFORM_STATIC_ASSERT(offsetof(KOVAVOLInfo, fsType) == 12, "fsType is at byte 12");
KOVAPLATFORM_STATIC_ASSERT(offsetof(KOVAVOLInfo, status) == 48, "status is at byte 48");
KOVAPLATFORM_STATIC_ASSERT(offsetof(KOVAVOLInfo, mountPath) == 52, "mountPath is at byte 52");
KOVAPLATFORM_STATIC_ASSERT(offsetof(KOVAVOLInfo, size) == 88, "size is at byte 88");
KOVAPLATFORM_STATIC_ASSERT(offsetof(KOVAVOLInfo, accessStatus) == 104,
                           "accessStatus is at byte 104");
KOVAPLATFORM_STATIC_ASSERT(offsetof(KOVAVOLInfo, next) == KOVA_VOL_INFO_FILLED_BYTES,
                           "next is at byte 112, after all that is filled");

#undef KOVAPLATFORM_STATIC_ASSERT

#endif
