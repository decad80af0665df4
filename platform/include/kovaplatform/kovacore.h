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

  KLIBC_ERR_BAD_KEY = 0xF201,          /**< the key could not be read back */
  KLIBC_ERR_BAD_VALUE = 0xF202,        /**< the value could not be read back */
  KLIBC_ERR_BAD_SECTION_NAME = 0xF203, /**< the section could not be read back */
  KLIBC_ERR_SECTION_EXISTS = 0xF204,   /**< the section is there already */
  KLIBC_ERR_SECTION_HIDDEN = 0xF205, /**< a broken header above would be taken for the section's */

  KLIBC_ERR_OPEN = 0xF301,        /**< the file could not be opened; errno says why */
  KLIBC_ERR_NOT_REGULAR = 0xF302, /**< it is no regular file */
  KLIBC_ERR_READ = 0xF303,        /**< it could not be read; errno says why */
  KLIBC_ERR_CREATE = 0xF304,      /**< no new file can be made beside it; errno says why */
  KLIBC_ERR_WRITE = 0xF305,       /**< the new content could not be written; errno says why */
  KLIBC_ERR_ATTRIBUTES = 0xF306,  /**< owner, mode or an attribute cannot be kept; errno says why */
  KLIBC_ERR_SYNC = 0xF307,        /**< the new content may not be on the disk; errno says why */
  KLIBC_ERR_RENAME = 0xF308,      /**< it could not be put in place; errno says why */
  KLIBC_ERR_DIR_SYNC = 0xF309,    /**< it is in place, but may not outlast a power cut */
  KLIBC_ERR_BUSY = 0xF30A,        /**< other writers replaced the file over and over */

  KLIBC_ERR_CRYPT = 0xF401,       /**< the encryption library does not start */
  KLIBC_ERR_BUFFER_SIZE = 0xF402, /**< the buffer is too small for the result */
  KLIBC_ERR_BAD_CIPHER = 0xF403,  /**< no cipher text, a changed one, or another key's */
  KLIBC_ERR_KEY_UNSAFE = 0xF404,  /**< the key file may be another's: its owner, mode or size */
  KLIBC_ERR_KEY_READ = 0xF405,    /**< the key file cannot be read; errno says why */
  KLIBC_ERR_KEY_MAKE = 0xF406,    /**< the key file cannot be made; errno says why */
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

/* Section files: text files that people edit too.
 *
 * A line that, trimmed of blanks (space, tab, line feed, carriage return), begins with '[' ends the
 * section before it; when it also ends with ']' it is a header, and the section's name is all
 * between, so that ']' may stand in a name. A section runs to the next line that begins with '['.
 * Within it a line with '=' is an option, split at its first '=', unless its trimmed key begins
 * with '#'. All other lines (comments, blank lines, other text) say nothing. The first section of a
 * name is the one that is read and changed; when it is removed, a second of that name takes its
 * place.
 *
 * A change keeps every byte outside the section. The lines of a section that are no options stay
 * also when its options are replaced: those above the first option and those below the last keep
 * their places; those between go with the next option below them that stays, or, where none does,
 * above the section's last lines. In a section without options they stand below the new ones.
 * Removing a section removes all of its lines, those above the next header included.
 * Options are written as "key=value" lines in the order of the hash. New lines end as the section's
 * header does, or the file's first line when the header is new or ends the file: with CR LF when it
 * does, else with LF. A file whose last line has no end gets one before a header is appended.
 *
 * A change is atomic and durable: the file is replaced by a new one, written and synced beside it,
 * with the old one's owner, group, mode and those extended attributes that the caller can see; what
 * cannot be kept fails the change. Readers see the old content or the new, whole. A failure leaves
 * the old file untouched and nothing beside it; only KLIBC_ERR_DIR_SYNC means that the new content
 * is in place. Symbolic links are followed and stay links; other hard links keep the old content.
 * The caller must be allowed to write the file and its directory. Where the file system has no
 * unnamed files, or in the moment before the end elsewhere, a killed writer leaves a file
 * ".kovacore.<number>.tmp" beside the section file; the next writer in that directory removes it.
 *
 * Files and lines may be of any length; a file is held in memory while a call lasts.
 * Errors:  NO_FILE, OPEN, NOT_REGULAR, READ, NO_MEMORY, BAD_PARAMETER; a change also
 *          BAD_SECTION_NAME (a name that is empty, has a blank at an end, or holds a line feed or a
 *          carriage return; nothing is opened then) and CREATE to BUSY.
 * errno:   as the failing system call left it, where the code says that one failed.
 * Threads: any; calls share nothing but the files.
 * Process: the writers of one file lose updates to each other unless they hold a lock of theirs
 *          from reading to writing; the file itself is always that of one writer, whole. */

/** Appends the name of every section of a file to *list, in file order; the list may move. Names
 *  that hold a NUL byte are left out.
 *  Returns 0 or more on success; negative on failure, the list is then as before. */
int KLIBCFileEnumSection(const char *path, KLIBCSzList **list);

/** Replaces the options of an existing section with the pairs of hash. reserved is null, flags 0.
 *  Returns 1 when done; 0 with NO_SECTION when the file has no such section; negative on any other
 *  failure. SECTION_HIDDEN: a line above the section, "[name" and one more character that is not
 *  ']', would be taken for its header, so that what is written would not be read. */
int KLIBCFileSetSection(const char *path, const char *name, const char *reserved, KLIBCSzHash *hash,
                        int flags);

/** Appends a section with the pairs of hash to an existing file. flags is 0.
 *  Returns 0 or more on success, negative on failure. SECTION_EXISTS, SECTION_HIDDEN (as above):
 *  the file has what would be read instead of the new section. */
int KLIBCFileAddSection(const char *path, const char *name, KLIBCSzHash *hash, int flags);

/** Removes a section, header and lines.
 *  Returns 1 when done; 0 with NO_SECTION when the file has no such section; negative on any other
 *  failure. */
int KLIBCFileRemoveSection(const char *path, const char *name);

/* Encryption of short texts under this machine's key.
 *
 * A cipher text consists of letters, digits, '-' and '_'. It can be decrypted on the machine that
 * made it, or where its key file is: the file that keyFile in section [secret] of the platform's
 * configuration names, else /var/lib/kovaplatform/secret.key. The first use makes the key, 32
 * random bytes, in a file of mode 0600. A file that group or others may use, that is neither root's
 * nor the caller's, or that has another size is refused. Without the file no cipher text is of any
 * use; back it up apart from them.
 *
 * The size limit leaves no room for a random part: equal texts have equal cipher texts, and the
 * length of a cipher text tells that of its text. A changed cipher text, or another key's, is
 * refused; the chance that a random one passes is 1 in 2^16 for texts of no or one byte and falls
 * with their length, to 1 in 2^128 from 28 bytes on.
 *
 * Errors:  BAD_PARAMETER, NO_MEMORY, CRYPT to KEY_MAKE, and the codes that kovasdk.h lists for the
 *          configuration file. buf is untouched on failure.
 * Log:     a line for a faulty configuration file only.
 * Threads: any. */

/** Encrypts NUL-terminated text of n bytes into at most size bytes, NUL included; 2 * (n + 2)
 *  bytes are enough. Returns non-zero on success, 0 on failure. */
int KLIBCCryptSzEncrypt(const char *plain, char *buf, int size);

/** Decrypts what KLIBCCryptSzEncrypt wrote; as many bytes as the cipher text has, but at least one,
 *  are enough. Returns non-zero on success, 0 on failure. */
int KLIBCCryptSzDecrypt(const char *cipher, char *buf, int size);

/** Forks as fork(2) does: negative on failure, with errno and KLIBC_ERR_FORK set; 0 in the child,
 *  the child's pid in the parent. */
pid_t KLIBCProcFork(void);

#pragma GCC visibility pop

#ifdef __cplusplus
}
#endif

#endif
