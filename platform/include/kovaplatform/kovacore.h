#ifndef KOVAPLATFORM_KOVACORE_H
#define KOVAPLATFORM_KOVACORE_H

/**
 * @file
 * The platform's core services: the record of its last error, string lists and hashes, section
 * files, encryption and fork.
 *
 * Failures are reported by return values. The error record of the calling thread says what went
 * wrong: a code, and the source file and line that recorded it.
 */

#include <stdint.h>
#include <sys/types.h>

#ifdef __cplusplus
extern "C" {
#endif

/* The platform's libraries export these names and no others. */
#pragma GCC visibility push(default)

/** Codes of the error record. Callers know the first two and act on them. The others are this
 *  platform's own and say what failed. */
enum KLIBCErrorCode {
  KLIBC_ERR_NO_FILE = 0x0900,    /**< no such file */
  KLIBC_ERR_NO_SECTION = 0x2000, /**< the file has no such section */

  KLIBC_ERR_BAD_PARAMETER = 0xF101, /**< a null argument, or a number out of range */
  KLIBC_ERR_NO_MEMORY = 0xF102,     /**< memory ran out */
  KLIBC_ERR_FORK = 0xF103,          /**< fork(2) failed; errno says why */

  KLIBC_ERR_BAD_KEY = 0xF201,          /**< a key that could not be read back from a file */
  KLIBC_ERR_BAD_VALUE = 0xF202,        /**< a value that could not be read back from a file */
  KLIBC_ERR_BAD_SECTION_NAME = 0xF203, /**< a name that could not be read back from a file */
  KLIBC_ERR_SECTION_EXISTS = 0xF204,   /**< the section already exists */
  KLIBC_ERR_SECTION_HIDDEN = 0xF205,   /**< readers would take a broken header for the section's */

  KLIBC_ERR_OPEN = 0xF301,        /**< the file could not be opened; errno says why */
  KLIBC_ERR_NOT_REGULAR = 0xF302, /**< the path does not name a regular file */
  KLIBC_ERR_READ = 0xF303,        /**< the file could not be read; errno says why */
  KLIBC_ERR_CREATE = 0xF304,      /**< no new file could be created beside it; errno says why */
  KLIBC_ERR_WRITE = 0xF305,       /**< the new content could not be written; errno says why */
  KLIBC_ERR_ATTRIBUTES = 0xF306,  /**< owner, mode or attributes cannot be kept; errno says why */
  KLIBC_ERR_SYNC = 0xF307,        /**< the new content may not be on the disk; errno says why */
  KLIBC_ERR_RENAME = 0xF308,      /**< the new content could not be put in place; errno says why */
  KLIBC_ERR_DIR_SYNC = 0xF309,    /**< it is in place, but may not outlast a power cut */
  KLIBC_ERR_BUSY = 0xF30A,        /**< other writers kept replacing the file */

  KLIBC_ERR_CRYPT = 0xF401,       /**< the encryption library cannot be initialised */
  KLIBC_ERR_BUFFER_SIZE = 0xF402, /**< the buffer is too small for the result */
  KLIBC_ERR_BAD_CIPHER = 0xF403,  /**< not a cipher text, a changed one, or another key's */
  KLIBC_ERR_KEY_UNSAFE = 0xF404,  /**< the key file cannot be trusted: its owner, mode or size */
  KLIBC_ERR_KEY_READ = 0xF405,    /**< the key file could not be read; errno says why */
  KLIBC_ERR_KEY_MAKE = 0xF406,    /**< the key file could not be created; errno says why */
};

/** Code of the calling thread's last error; 0 when none was recorded. Leaves errno unchanged. */
int KLIBCErrGet(void);

/** Source file that recorded the last error; "" when none was recorded. Never null. The text
 *  belongs to the platform and is valid until the thread records its next error. */
const char *KLIBCErrorGetFile(void);

/** Source line that recorded the last error; 0 when none was recorded. */
int KLIBCErrorGetLine(void);

/** Records an error for the calling thread. file is copied; null is recorded as "". Leaves errno
 *  unchanged. */
void KLIBCErrSetEx(int code, const char *file, int line);

/** A list of strings that grows. Callers read count; the rest belongs to the platform. */
typedef struct KLIBCSzList {
  int32_t capacity; /**< strings that fit before the list grows */
  int32_t count;    /**< strings that it holds */
                    /* private from here */
} KLIBCSzList;

/** Creates an empty list with room for capacity strings (0 or more). Returns null on failure. The
 *  caller frees it with KLIBCSzListFree. */
KLIBCSzList *KLIBCSzListAlloc(int capacity);

/** The string at a 0-based index; null, with an error recorded, for an index outside the list. The
 *  string belongs to the list and is valid until the list is appended to or freed. */
const char *KLIBCSzListGet(const KLIBCSzList *list, int index);

/** Frees a list and its strings. Null is allowed. */
void KLIBCSzListFree(KLIBCSzList *list);

/** Key and value strings in the order in which their keys were first set; opaque to callers. */
typedef struct KLIBCSzHash KLIBCSzHash;

/** Creates an empty hash. capacity (0 or more) is a hint; a hash grows as needed. Returns null on
 *  failure. The caller frees it with KLIBCSzHashFree. */
KLIBCSzHash *KLIBCSzHashAlloc(int capacity);

/** Stores a value under a key. If the key already exists, its value is replaced and the key keeps
 *  its position in the order. The hash may move, so the caller passes the address of its handle.
 *  Both texts are copied.
 *
 *  What could not be read back from a section file is refused. KLIBC_ERR_BAD_KEY: a key that is
 *  empty, that begins or ends with white space (space, tab, line feed, carriage return), that
 *  contains '=', a line feed or a carriage return, or that begins with '#' or '['.
 *  KLIBC_ERR_BAD_VALUE: a value that contains a line feed or a carriage return. Leading and
 *  trailing white space of a value is stored, but readers trim it; JSON texts have none.
 *
 *  Returns 0 or more on success. Returns a negative number on failure and leaves the hash
 *  unchanged. */
int KLIBCSzHashSetValue(KLIBCSzHash **hash, const char *key, const char *value);

/** Frees a hash and its strings. Null is allowed. */
void KLIBCSzHashFree(KLIBCSzHash *hash);

/* Section files: text files that people edit as well.
 *
 * Lines are read trimmed of white space (space, tab, line feed, carriage return). A line that
 * begins with '[' ends the section above it. If it also ends with ']' it is a header, and the name
 * of the section is everything in between, so a name may contain ']'. A section runs to the next
 * line that begins with '['. Within a section, a line with '=' is an option, split at the first
 * '=', unless the trimmed key begins with '#'. All other lines (comments, blank lines, other text)
 * have no meaning. When several sections have the same name, the first one is read and changed.
 * When it is removed, the second one takes its place.
 *
 * A change keeps every byte outside the section. Within the section, the lines that are not options
 * are kept even when its options are replaced. Those above the first option and those below the
 * last one keep their positions. Those in between stay above the next option below them that
 * remains or, if none does, above the section's last lines. In a section without options they end
 * up below the new ones. Removing a section removes all of its lines, including those directly
 * above the next header.
 *
 * Options are written as "key=value" lines in the order of the hash. New lines end as the section's
 * header does: with CR LF if it does, otherwise with LF. If the header is new or is the end of the
 * file, the file's first line decides. If the last line of a file has no line end, it gets one
 * before a header is appended.
 *
 * A change is atomic and durable. A new file is written and synced beside the old one, gets its
 * owner, group, mode and those of its extended attributes that the caller can see, and replaces it;
 * if any of these cannot be kept, the change fails. Readers see the complete old content or the
 * complete new content. After a failure the old file is unchanged and nothing is left beside it;
 * only KLIBC_ERR_DIR_SYNC means that the new content is in place. Symbolic links are followed and
 * remain links. Other hard links keep the old content. The caller needs permission to write the
 * file and its directory. A writer that is killed may leave a file ".kovacore.<number>.tmp" beside
 * the section file: at any time where the file system does not support unnamed files, otherwise
 * only in the last moment of the change. The next writer in that directory removes it.
 *
 * Files and lines may have any length. A change holds the complete file in memory. Listing holds a
 * block of it and, one at a time, the lines that begin with '['.
 * Errors:  NO_FILE, OPEN, NOT_REGULAR, READ, NO_MEMORY, BAD_PARAMETER. A change may also fail with
 *          CREATE to BUSY, and with BAD_SECTION_NAME for a name that is empty, begins or ends with
 *          white space, or contains a line feed or a carriage return; no file is opened then.
 * errno:   as the failing system call left it, where the code says that one failed.
 * Threads: any; calls share nothing but the files.
 * Process: two writers of one file may lose each other's updates unless each holds a lock from
 *          reading to writing. Without a lock, too, the file is always the complete work of one
 * writer. */

/** Appends the names of all sections of a file to *list, in the order of the file; the list may
 *  move. Names that contain a NUL byte are left out. Returns 0 or more on success. Returns a
 *  negative number on failure and leaves the list unchanged. */
int KLIBCFileEnumSection(const char *path, KLIBCSzList **list);

/** Replaces the options of an existing section with the pairs of hash. reserved is null, flags is
 *  0. Returns 1 on success, 0 with NO_SECTION when the file has no such section, and a negative
 *  number on any other failure. SECTION_HIDDEN: a line above the section, "[name" and one more
 *  character that is not ']', would be taken for its header, so readers would not find what is
 *  written. */
int KLIBCFileSetSection(const char *path, const char *name, const char *reserved, KLIBCSzHash *hash,
                        int flags);

/** Appends a section with the pairs of hash to an existing file. flags is 0.
 *  Returns 0 or more on success, a negative number on failure. SECTION_EXISTS and SECTION_HIDDEN
 *  (as above): the file contains something that would be read instead of the new section. */
int KLIBCFileAddSection(const char *path, const char *name, KLIBCSzHash *hash, int flags);

/** Removes a section: its header and its lines.
 *  Returns 1 on success, 0 with NO_SECTION when the file has no such section, and a negative number
 *  on any other failure. */
int KLIBCFileRemoveSection(const char *path, const char *name);

/* Encryption of short texts with this machine's key.
 *
 * A cipher text consists of letters, digits, '-' and '_'. It can be decrypted only with the key
 * file that it was encrypted with: the file that keyFile in section [secret] of the platform's
 * configuration names, or /var/lib/kovaplatform/secret.key. The first use creates the key, 32
 * random bytes, in a file of mode 0600. A file is refused if group or others may access it, if its
 * owner is neither root nor the caller, or if it has another size. Cipher texts are useless without
 * the file; back it up separately from them.
 *
 * The size limit leaves no room for a random part. So equal texts have equal cipher texts, and the
 * length of a cipher text reveals that of its text. A cipher text that was changed, or that belongs
 * to another key, is refused. The chance that a random one passes is 1 in 2^16 for texts of up to
 * one byte and decreases with their length, to 1 in 2^128 from 28 bytes on.
 *
 * Errors:  BAD_PARAMETER, NO_MEMORY, CRYPT to KEY_MAKE, and the codes that kovasdk.h lists for the
 *          configuration file. buf is unchanged on failure.
 * Log:     one line for a faulty configuration file; nothing else.
 * Threads: any. */

/** Encrypts a NUL-terminated text of n bytes into at most size bytes, including the NUL; 2 * (n +
 *  2) bytes are enough. Returns non-zero on success, 0 on failure. */
int KLIBCCryptSzEncrypt(const char *plain, char *buf, int size);

/** Decrypts what KLIBCCryptSzEncrypt wrote. A buffer as large as the cipher text is large enough,
 *  but it needs at least one byte. Returns non-zero on success, 0 on failure. */
int KLIBCCryptSzDecrypt(const char *cipher, char *buf, int size);

/** Forks as fork(2) does. Returns 0 in the child and the child's PID in the parent, or a negative
 *  number with errno set and KLIBC_ERR_FORK recorded. */
pid_t KLIBCProcFork(void);

#pragma GCC visibility pop

#ifdef __cplusplus
}
#endif

#endif
