/* SPDX-License-Identifier: Apache-2.0 */
/* Stands in for iptables: records how it was started and ends as the recorder's rules say. */
#include "recordingProgram.h"

#include <fcntl.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

enum { FIRST_HANDLE = 3, LAST_HANDLE = 255, BROKEN = 99 };

static void broken(const char *what) {
    perror(what);
    exit(BROKEN);
}

/* The whole file, with a NUL behind it. */
static char *readAll(int file, size_t *size) {
    struct stat status;
    if (fstat(file, &status) != 0)
        broken("fstat");
    char *text = calloc(1, (size_t)status.st_size + 1);
    if (text == NULL || pread(file, text, (size_t)status.st_size, 0) != status.st_size)
        broken("read");
    *size = (size_t)status.st_size;
    return text;
}

/* Takes the next field of a text of NUL-ended fields. */
static const char *nextField(const char **at, const char *end) {
    const char *field = *at;
    if (field >= end)
        return NULL;
    *at += strlen(field) + 1;
    return field;
}

static unsigned countRuns(int record) {
    size_t size;
    char *text = readAll(record, &size);
    const char *at = text;
    const char *end = text + size;
    unsigned runs = 0;
    for (const char *words; (words = nextField(&at, end)) != NULL; ++runs) {
        const char *handles = nextField(&at, end);
        for (long left = strtol(words, NULL, 10) + (handles ? strtol(handles, NULL, 10) : 0); left > 0; --left)
            nextField(&at, end);
    }
    free(text);
    return runs;
}

static char *join(int count, char **words) {
    size_t size = 1;
    for (int i = 0; i < count; ++i)
        size += strlen(words[i]) + 1;
    char *line = calloc(1, size);
    if (line == NULL)
        broken("calloc");
    for (int i = 0; i < count; ++i) {
        if (i > 0)
            strcat(line, " ");
        strcat(line, words[i]);
    }
    return line;
}

static void record(int file, int argc, char **argv) {
    char *buffer = NULL;
    size_t size = 0;
    FILE *out = open_memstream(&buffer, &size);
    if (out == NULL)
        broken("open_memstream");
    int handles[LAST_HANDLE + 1];
    int count = 0;
    for (int handle = FIRST_HANDLE; handle <= LAST_HANDLE; ++handle) {
        if (handle != file && fcntl(handle, F_GETFD) != -1)
            handles[count++] = handle;
    }
    fprintf(out, "%d%c%d%c", argc, 0, count, 0);
    for (int i = 0; i < argc; ++i)
        fprintf(out, "%s%c", argv[i], 0);
    for (int i = 0; i < count; ++i)
        fprintf(out, "%d%c", handles[i], 0);
    if (fclose(out) != 0 || write(file, buffer, size) != (ssize_t)size)
        broken("write " RECORDER_RECORD);
    free(buffer);
}

/* Ends the program when a rule says so. */
static void applyRules(unsigned run, const char *line) {
    int file = open(RECORDER_RULES, O_RDONLY | O_CLOEXEC);
    if (file < 0)
        broken(RECORDER_RULES);
    size_t size;
    char *text = readAll(file, &size);
    close(file);
    const char *at = text;
    const char *end = text + size;
    int status = 0;
    const char *message = "";
    for (const char *kind; status == 0 && (kind = nextField(&at, end)) != NULL;) {
        const char *value = nextField(&at, end);
        const char *code = nextField(&at, end);
        const char *words = nextField(&at, end);
        if (value == NULL || code == NULL || words == NULL)
            break;
        if (strcmp(kind, "delay") == 0) {
            const long milliseconds = strtol(value, NULL, 10);
            const struct timespec pause = {milliseconds / 1000, milliseconds % 1000 * 1000000};
            nanosleep(&pause, NULL);
        } else if (strcmp(kind, "at") == 0 ? (unsigned)strtol(value, NULL, 10) == run : strstr(line, value) != NULL) {
            status = (int)strtol(code, NULL, 10);
            message = words;
        }
    }
    if (status != 0) {
        if (*message != 0)
            fprintf(stderr, "%s\n", message);
        exit(status);
    }
    free(text);
}

int main(int argc, char **argv) {
    const int file = open(RECORDER_RECORD, O_RDWR | O_APPEND | O_CLOEXEC);
    if (file < 0)
        broken(RECORDER_RECORD);
    /* One run at a time, so that each knows its number. */
    if (flock(file, LOCK_EX) != 0)
        broken("flock");
    record(file, argc, argv);
    struct stat rules;
    const int ruled = stat(RECORDER_RULES, &rules) == 0 && rules.st_size > 0;
    const unsigned run = ruled ? countRuns(file) : 0;
    close(file);
    if (ruled) {
        char *line = join(argc, argv);
        applyRules(run, line);
        free(line);
    }
    return 0;
}
