/* SPDX-License-Identifier: Apache-2.0 */
/* libveldcore: processes, key/value files, file locks, string lists, the last-error record, system capabilities. */
#ifndef VELD_CORE_H
#define VELD_CORE_H

#include <stdio.h>

#ifdef __cplusplus
extern "C" {
#endif

#pragma GCC visibility push(default)

/* Runs the program at `path` without a shell. argv ends with NULL. With `wait` 1: 0 when it exits with status 0, -1
 * when it cannot be started, exits otherwise or is killed. With `wait` 0: 0 when it could be started, -1 otherwise. */
int VLIBCExecv(const char *path, char *const argv[], int wait);

/* Opens a pipe from ("r") or to ("w") the program at `path`, without a shell. The arguments after the program name are
 * `arg` and those that follow, ending with (char *)NULL. NULL on failure. */
FILE *VLIBCPopen(const char *path, const char *mode, const char *arg, ... /* char *, ending with NULL */);
/* Closes the pipe and waits for the program: its exit status, or -1. */
int VLIBCPclose(FILE *stream);

/* Key/value files hold lines key="value" or key=value. `flags` is 0. */
/* Copies the value of `key` into `buf` (`size` bytes with the NUL; longer values are cut): the length copied, 0 when
 * the key is absent or empty, negative on error. */
int VLIBCFileGetKeyValue(const char *file, const char *key, char *buf, int size, int flags);
/* Replaces or appends the key's line: 0 or more on success, negative on error. */
int VLIBCFileSetKeyValue(const char *file, const char *key, const char *value, int flags);
/* 1 when the key has exactly that value, else 0. */
int VLIBCFileCheckKeyValue(const char *file, const char *key, const char *value, int flags);
/* Non-zero when `path` is an existing regular file. */
int VLIBCFileExist(const char *path);

/* Takes a lock on the file at `path`, creating it when missing: 1 and an open descriptor in `fd`, or 0 after `seconds`
 * seconds or on error. `exclusive` 1 shuts out every other holder, 0 shares with other sharers. */
int VLIBCFileLockTimeByFile(const char *path, int exclusive, int seconds, int *fd);
/* Releases the lock and closes the descriptor: non-zero on success. */
int VLIBCFileUnlockByFile(int fd);

/* Growable list of C strings, which it copies. */
typedef struct VLIBCSzList {
    int nItem;     /* number of strings */
    int nCapacity; /* number of strings for which there is room */
    char **items;  /* the strings, each allocated by itself */
} VLIBCSZLIST, *PVLIBCSZLIST;

/* A list with room for `size` strings, or NULL. */
PVLIBCSZLIST VLIBCSzListAlloc(int size);
/* Appends a copy; may move the list. The number of strings, or negative on failure (the list is then unchanged). */
int VLIBCSzListPush(PVLIBCSZLIST *list, const char *item);
/* The string at `index`, owned by the list, or NULL. */
const char *VLIBCSzListGet(const VLIBCSZLIST *list, int index);
/* Frees the list and its strings; NULL is allowed. */
void VLIBCSzListFree(PVLIBCSZLIST list);

/* The last error of the calling thread: a code and the place that set it. `file` is not copied: pass a literal. */
void VLIBCErrSetEx(int code, const char *file, int line);
int VLIBCErrGet(void);
const char *VLIBCErrorGetFile(void); /* never NULL */
int VLIBCErrorGetLine(void);

/* 1 when the system has the capability `key`, else 0. */
int VLIBCSupportGet(const char *key);

#pragma GCC visibility pop

#ifdef __cplusplus
}
#endif

#endif
