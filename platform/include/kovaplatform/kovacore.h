#ifndef KOVAPLATFORM_KOVACORE_H
#define KOVAPLATFORM_KOVACORE_H

/**
 * @file
 * The platform's core services: the record of its last error, string lists and hashes, section
 * files, encryption and fork.
 *
 * Failures are reported by return values; what went wrong stands in the error record of the
 * calling thread: a code, and the source file and line that set it.
 */

#include <stdint.h>
#include <sys/types.h>

#ifdef __cplusplus
extern "C" {
#endif

/* These names are what the platform's libraries export, and all that they export. */
#pragma GCC visibility push(default)

/** Codes of the error record. The first two are known to callers, who act on them; the others are
 *  this platform's own and say what failed. */
enum KLIBCErrorCode {
  KLIBC_ERR_NO_FILE = 0x0900,    /**< no such file */
  KLIBC_ERR_NO_SECTION = 0x2000, /**< the file has no such section */

  KLIBC_ERR_BAD_PARAMETER = 0xF101, /**< a null argument, or a number that means nothing */
  KLIBC_ERR_NO_MEMORY = 0xF102,     /**< memory ran out */
  KLIBC_ERR_FORK = 0xF103,          /**< fork(2) failed; errno says why */
  KLIBC_ERR_NOT_AVAILABLE = 0xF104, /**< this build does not have the service */

  KLIBC_ERR_BAD_KEY = 0xF201,   /**< the key could not be read back from a section file */
  KLIBC_ERR_BAD_VALUE = 0xF202, /**< the value could not be read back from a section file */
};

/** Code of the calling thread's last error; 0 when none was recorded. Leaves errno alone. */
int KLIBCErrGet(void);

/** Source file that recorded the last error; "" when none was. Never null. The text belongs to
 *  the platform and holds until the thread's next recorded error. */
const char *KLIBCErrorGetFile(void);

/** Source line that recorded the last error; 0 when none was. */
int KLIBCErrorGetLine(void);

/** Records an error for the calling thread. file is copied and may be null (then "").
 *  Leaves errno alone. */
void KLIBCErrSetEx(int code, const char *file, int line);

/** A growable list of strings. Callers read count; the rest belongs to the platform. */
typedef struct KLIBCSzList {
  int32_t capacity; /**< strings that fit before the list grows */
  int32_t count;    /**< strings that it holds */
                    /* private from here */
} KLIBCSzList;

/** Makes an empty list with room for capacity strings (0 or more). Returns null on failure. Free it
 *  with KLIBCSzListFree. */
KLIBCSzList *KLIBCSzListAlloc(int capacity);

/** The string at a 0-based index; null, with an error code, outside the list. It belongs to the
 * list and holds until the list is appended to or freed. */
const char *KLIBCSzListGet(const KLIBCSzList *list, int index);

/** Frees a list and its strings. Null is allowed. */
void KLIBCSzListFree(KLIBCSzList *list);

/** Key and value strings in the order in which their keys were first set; opaque to callers. */
typedef struct KLIBCSzHash KLIBCSzHash;

/** Makes an empty hash. capacity (0 or more) is a hint; a hash grows as needed. Returns null on
 *  failure. Free it with KLIBCSzHashFree. */
KLIBCSzHash *KLIBCSzHashAlloc(int capacity);

/** Stores a value under a key. An earlier value of the key is replaced and the key keeps its place
 *  in the order. May move the hash, hence the handle's address. Copies both texts.
 *
 *  Refused is what could not be read back from a section file: a key that is empty, has a blank
 *  (space, tab, line feed, carriage return) at an end, holds '=', a line feed or a carriage return,
 *  or begins with '#' or '[' (KLIBC_ERR_BAD_KEY); a value that holds a line feed or a carriage
 *  return (KLIBC_ERR_BAD_VALUE). Blanks at the ends of a value are stored, but readers trim them;
 *  JSON texts have none.
 *
 *  Returns 0 or more on success, negative on failure; the hash is then as before. */
int KLIBCSzHashSetValue(KLIBCSzHash **hash, const char *key, const char *value);

/** Frees a hash and its strings. Null is allowed. */
void KLIBCSzHashFree(KLIBCSzHash *hash);

/** Appends the name of every section of a file to *list, in file order; the list may move.
 *  Returns 0 or more on success, negative on failure (code 0x0900: no such file). */
int KLIBCFileEnumSection(const char *path, KLIBCSzList **list);

/** Replaces the lines of an existing section with the pairs of hash.
 *  Returns 1 when done, 0 with code 0x2000 when the file has no such section, negative on any
 *  other failure (code 0x0900: no such file). reserved is null and flags 0. */
int KLIBCFileSetSection(const char *path, const char *name, const char *reserved, KLIBCSzHash *hash,
                        int flags);

/** Appends a section with the pairs of hash to an existing file. Returns 0 or more on success,
 *  negative on failure. flags is 0. */
int KLIBCFileAddSection(const char *path, const char *name, KLIBCSzHash *hash, int flags);

/** Removes a section, header and lines. Returns 1 when done; anything else is failure. */
int KLIBCFileRemoveSection(const char *path, const char *name);

/** Encrypts NUL-terminated text of n bytes into at most size bytes, NUL included; 2 * (n + 2)
 *  bytes are enough. Returns non-zero on success, 0 on failure. */
int KLIBCCryptSzEncrypt(const char *plain, char *buf, int size);

/** Decrypts what KLIBCCryptSzEncrypt wrote. Returns non-zero on success, 0 on failure. */
int KLIBCCryptSzDecrypt(const char *cipher, char *buf, int size);

/** Forks as fork(2) does: negative on failure, 0 in the child, the child's pid in the parent. */
pid_t KLIBCProcFork(void);

#pragma GCC visibility pop

#ifdef __cplusplus
}
#endif

#endif
