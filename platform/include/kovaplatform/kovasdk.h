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
 * A volume is a mounted file system that holds data: one of a disk or a pool (ext2, ext3, ext4,
 * btrfs, xfs, f2fs, zfs, ntfs, exfat, vfat). Not the system's own mounts: / /boot* /efi /usr /var
 * and /tmp themselves, and all at or below /var/log, /var/tmp and the places of snaps and of
 * containers (/snap, /var/lib/docker and the like). However often a file system is mounted or
 * bound, it counts once: as the first of its mounts that shows its root, or the first of all when
 * none does, as with subvolumes. When that one is the system's, the file system is, wherever else
 * it is bound to.
 *
 * A mount path longer than 35 bytes does not fit the record. Another mount of the file system takes
 * its place where there is one; else the volume is left out, with a warning in the system log. The
 * services that take or give paths of their own work for it too.
 *
 * The stand-in reads the mount table of the process, sysfs and its configuration file anew in every
 * call. None is needed; it is /etc/kovaplatform/platform.conf, or the file that the environment
 * variable KOVA_PLATFORM_CONF names, in the section-file format with JSON values:
 *
 *     [volume data]              # a directory that is to be a volume, whatever it lies on: above
 *     path="/srv/data"           # all on a machine whose only file system is /
 *     fsType=2                   # these three are those of its file system where they are not set
 *     size=1000000000
 *     removable=false
 *     [mounts]
 *     exclude=["/mnt/scratch"]   # mount paths that are no volumes
 *     [secret]
 *     keyFile="/etc/kovaplatform/secret.key"
 *
 * (In the file itself a comment has a line of its own.) An error in it fails every call.
 *
 * Failure:   by return value; the error record (KLIBCErrGet) has one of the codes below. Nothing is
 *            written to outputs on failure.
 * errno:     not meaningful.
 * Log:       LOG_ERR for an error in the configuration and an unreadable mount table; else where a
 *            function says so.
 * Threads:   any; calls are independent.
 * Process:   no state but for one line that is logged once. Descriptors are close-on-exec.
 */

#include <stddef.h>
#include <stdint.h>

/**
 * Error codes. They are the stand-in's own.
 *
 *     code    name                       what happened
 *     0x3001  KOVA_SDK_ERR_ARGUMENT      a null or empty argument, or one that must be 0 is not
 *     0x3002  KOVA_SDK_ERR_NO_MEMORY     there was no memory
 *     0x3003  KOVA_SDK_ERR_MOUNTS        the mount table cannot be read
 *     0x3004  KOVA_SDK_ERR_PATH          the path cannot be resolved
 *     0x3005  KOVA_SDK_ERR_NO_VOLUME     the path lies on no volume, or is no volume's mount path
 *     0x3006  KOVA_SDK_ERR_TOO_LONG      the volume's mount path does not fit the record
 *     0x3007  KOVA_SDK_ERR_TOO_SMALL     a buffer is too small for its text
 *     0x3008  KOVA_SDK_ERR_TMP_DIR       the share temporary directory cannot be made, or something
 *                                        that is no directory stands in its place
 *     0x3009  KOVA_SDK_ERR_NO_SHARE      the path lies in no share
 *     0x300A  KOVA_SDK_ERR_SIZE          the size of the file system cannot be read
 *     0x3101  KOVA_CONF_ERR_OPEN         the configuration file cannot be opened or read
 *     0x3102  KOVA_CONF_ERR_UNSAFE       it is no regular file, or group or others may write it
 *     0x3103  KOVA_CONF_ERR_SYNTAX       a line is neither blank, comment, header nor key=value
 *     0x3104  KOVA_CONF_ERR_SECTION      unknown section
 *     0x3105  KOVA_CONF_ERR_KEY          unknown key, or an option before the first section
 *     0x3106  KOVA_CONF_ERR_VALUE        a value is no JSON text or has the wrong type
 *     0x3107  KOVA_CONF_ERR_NO_PATH      a volume has no path
 *     0x3108  KOVA_CONF_ERR_TWICE        a section stands twice
 *     0x3109  KOVA_CONF_ERR_NO_MEMORY    there was no memory for the configuration
 *
 * With a KOVA_CONF_ERR_* code, file and line of the error record are the configuration file's path
 * and the line in it; 0 is the file as a whole. Every service that needs the configuration may fail
 * with one of them.
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

/** Kinds of file systems in a volume's record. The first three are the platform's, the rest the
 *  stand-in's own. */
#define KOVA_VOL_FS_OTHER 0 /**< any other; only under a directory that the configuration names */
#define KOVA_VOL_FS_EXT 1   /**< ext2 and ext3 */
#define KOVA_VOL_FS_EXT4 2
#define KOVA_VOL_FS_BTRFS 3
#define KOVA_VOL_FS_XFS 4
#define KOVA_VOL_FS_F2FS 5
#define KOVA_VOL_FS_ZFS 6
#define KOVA_VOL_FS_NTFS 7
#define KOVA_VOL_FS_EXFAT 8
#define KOVA_VOL_FS_VFAT 9

/** Bits of a location mask. */
#define KOVA_VOL_LOC_INTERNAL 1
#define KOVA_VOL_LOC_REMOVABLE 2 /**< removable media, or a disk on USB */

/** Bits of enumFlags. */
#define KOVA_VOL_ENUM_MOUNTED 1   /**< mounted volumes only */
#define KOVA_VOL_ENUM_READ_ONLY 2 /**< also read-only ones */

#ifdef __cplusplus
extern "C" {
#endif

/* These names are what the platform's libraries export, and all that they export. */
#pragma GCC visibility push(default)

/** One mounted volume. The positions of the named fields are the contract between the platform
 *  and its callers; the bytes between them are the platform's own. */
typedef struct KOVAVOLInfo {
  unsigned char reserved0[12];
  int32_t fsType; /**< byte 12: KOVA_VOL_FS_* */
  unsigned char reserved16[32];
  uint32_t status;    /**< byte 48: non-zero while mounted */
  char mountPath[36]; /**< byte 52: NUL-terminated */
  uint64_t size;      /**< byte 88: total bytes, also those in use or kept for root */
  unsigned char reserved96[8];
  uint32_t accessStatus; /**< byte 104: non-zero when writable */
  unsigned char reserved108[4];
  struct KOVAVOLInfo *next; /**< byte 112: next record of a list, null at its end */
} KOVAVOLInfo;

/** The part of the record that KOVAMountVolInfoGet fills. */
#define KOVA_VOL_INFO_FILLED_BYTES 112

/**
 * The locations (KOVA_VOL_LOC_*) at which this machine has volumes now.
 *
 * Returns: their mask; 0 when there are none, or on failure.
 */
int KOVAVolumeSupportLocGet(void);

/**
 * Lists the volumes of the locations in a mask: mounted ones in the order of the mount table, then
 * the directories that the configuration names, in its order. Read-only volumes are left out unless
 * KOVA_VOL_ENUM_READ_ONLY is set. A directory that the configuration names and that is not there is
 * a volume that is not mounted: listed, with status 0, unless KOVA_VOL_ENUM_MOUNTED is set.
 *
 * reserved: 0. Bits of location and enumFlags that are not named above are ignored.
 * Returns: head of a list, or null when there is none or on failure.
 * Owns:    the caller frees the list with KOVAMountVolInfoFree.
 * Log:     LOG_WARNING for each volume that is left out since its mount path is too long or its
 *          size cannot be read; and once in a process when the machine has no volumes at all.
 */
KOVAVOLInfo *KOVAMountVolAllEnum(int reserved, int location, int enumFlags);

/**
 * Describes the volume that holds path. Links, ".", ".." and bind mounts are resolved first: a path
 * on a bind mount lies on the volume that its file system is.
 *
 * path:    must exist.
 * info:    gets its first KOVA_VOL_INFO_FILLED_BYTES bytes only; a caller's record may end there.
 * Returns: 0 on success; -1 on failure.
 */
int KOVAMountVolInfoGet(const char *path, KOVAVOLInfo *info);

/** Frees a list of KOVAMountVolAllEnum. Null is allowed. */
void KOVAMountVolInfoFree(KOVAVOLInfo *list);

/**
 * Writes the share temporary directory of a volume, <mountPath>/.kova_tmp, making it with mode
 * 01777 where it is not there. A directory found with another mode gets this one. A link or a file
 * in its place is a failure and is left as it is. On a file system that keeps no modes (ntfs,
 * exfat, vfat) the mount's options decide who may write.
 *
 * mountPath: of a volume as the other services name it; a directory that is none is a failure, so
 *            that a volume unmounted meanwhile does not fill the directory below it.
 * buf:     size bytes, NUL included; too small is a failure, and then nothing is made.
 * Returns: 0 on success; -1 on failure.
 */
int KOVAShareTmpPathGet(const char *mountPath, char *buf, int size);

/**
 * Writes name and path of the share that holds path: the directory right below the mount path of
 * the volume on which path lies. Names that begin with "." or "@" are no shares. The path is
 * resolved as KOVAMountVolInfoGet does. With a volume at /volume1, "/volume1/music/a" and
 * "/volume1/music" give "music" and "/volume1/music"; "/volume1" and "/volume1/@eaDir/x" lie in no
 * share.
 *
 * path:    must exist.
 * name, sharePath: nameSize and sharePathSize bytes, NUL included; too small is a failure.
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

KOVAPLATFORM_STATIC_ASSERT(offsetof(KOVAVOLInfo, fsType) == 12, "fsType stands at byte 12");
KOVAPLATFORM_STATIC_ASSERT(offsetof(KOVAVOLInfo, status) == 48, "status stands at byte 48");
KOVAPLATFORM_STATIC_ASSERT(offsetof(KOVAVOLInfo, mountPath) == 52, "mountPath stands at byte 52");
KOVAPLATFORM_STATIC_ASSERT(offsetof(KOVAVOLInfo, size) == 88, "size stands at byte 88");
KOVAPLATFORM_STATIC_ASSERT(offsetof(KOVAVOLInfo, accessStatus) == 104,
                           "accessStatus stands at byte 104");
KOVAPLATFORM_STATIC_ASSERT(offsetof(KOVAVOLInfo, next) == KOVA_VOL_INFO_FILLED_BYTES,
                           "next stands at byte 112, after all that is filled");

#undef KOVAPLATFORM_STATIC_ASSERT

#endif
