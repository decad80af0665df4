#ifndef KOVAPLATFORM_KOVASDK_H
#define KOVAPLATFORM_KOVASDK_H

/**
 * @file
 * The platform's storage services: mounted volumes and shares.
 */

#include <stddef.h>
#include <stdint.h>

/**
 * Error codes. They are the stand-in's own.
 *
 *     code    name                       what happened
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
#define KOVA_CONF_ERR_OPEN 0x3101
#define KOVA_CONF_ERR_UNSAFE 0x3102
#define KOVA_CONF_ERR_SYNTAX 0x3103
#define KOVA_CONF_ERR_SECTION 0x3104
#define KOVA_CONF_ERR_KEY 0x3105
#define KOVA_CONF_ERR_VALUE 0x3106
#define KOVA_CONF_ERR_NO_PATH 0x3107
#define KOVA_CONF_ERR_TWICE 0x3108
#define KOVA_CONF_ERR_NO_MEMORY 0x3109

#ifdef __cplusplus
extern "C" {
#endif

/* These names are what the platform's libraries export, and all that they export. */
#pragma GCC visibility push(default)

/** One mounted volume. The positions of the named fields are the contract between the platform
 *  and its callers; the bytes between them are the platform's own. */
typedef struct KOVAVOLInfo {
  unsigned char reserved0[12];
  int32_t fsType; /**< byte 12: 1 ext2 and ext3, 2 ext4, 3 btrfs, other numbers for the rest */
  unsigned char reserved16[32];
  uint32_t status;    /**< byte 48: non-zero while mounted */
  char mountPath[36]; /**< byte 52: NUL-terminated */
  uint64_t size;      /**< byte 88: total bytes */
  unsigned char reserved96[8];
  uint32_t accessStatus; /**< byte 104: non-zero when writable */
  unsigned char reserved108[4];
  struct KOVAVOLInfo *next; /**< byte 112: next record of a list, null at its end */
} KOVAVOLInfo;

/** The part of the record that KOVAMountVolInfoGet fills. */
#define KOVA_VOL_INFO_FILLED_BYTES 112

/** The mask of volume locations that this machine has: 1 internal, 2 removable or hot-plugged;
 *  0 when the platform cannot tell or has none. */
int KOVAVolumeSupportLocGet(void);

/** Lists the mounted volumes of the locations in the mask. enumFlags bit 0: mounted ones only,
 *  bit 1: also read-only ones. reserved is 0. Returns the head of a list that the caller frees
 *  with KOVAMountVolInfoFree, or null when there is none or on failure (with an error code). */
KOVAVOLInfo *KOVAMountVolAllEnum(int reserved, int location, int enumFlags);

/** Describes the volume that holds path. Writes the first KOVA_VOL_INFO_FILLED_BYTES bytes of
 *  *info only, so a caller's record may end there. Returns 0 or more on success, negative on
 *  failure. */
int KOVAMountVolInfoGet(const char *path, KOVAVOLInfo *info);

/** Frees a list of KOVAMountVolAllEnum. Null is allowed. */
void KOVAMountVolInfoFree(KOVAVOLInfo *list);

/** Writes the share temporary directory of the volume mounted at mountPath into buf (size bytes,
 *  NUL included), making the directory on demand. Returns 0 or more on success, negative on
 *  failure. */
int KOVAShareTmpPathGet(const char *mountPath, char *buf, int size);

/** Writes name and path of the share that holds path. Returns 0 or more on success, negative on
 *  failure. */
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
