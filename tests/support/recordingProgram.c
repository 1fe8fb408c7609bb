/* SPDX-License-Identifier: Apache-2.0 */
/* Stands in for iptables: records how it was started and ends as the recorder's rules say. */
#include "recordingProgram.h"

#include <fcntl.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/file.h>
#include <time.h>

enum { FIRST_HANDLE = 3, LAST_HANDLE = 255, BROKEN = 99 };

static void broken(const char *what) {
    perror(what);
    exit(BROKEN);
}

/* Appends this run. Returns its number, from 1. */
static long record(int argc, char **argv) {
    FILE *file = fopen(RECORDER_RECORD, "a+e");
    /* One run at a time, so that each knows its number. */
    if (file == NULL || flock(fileno(file), LOCK_EX) != 0)
        broken(RECORDER_RECORD);
    setvbuf(file, NULL, _IOFBF, 1 << 17); /* written at once, for a recorder that reads meanwhile */
    long run = 1;
    rewind(file);
    for (int c; (c = getc(file)) != EOF;)
        run += c == END_OF_RUN;
    for (int handle = FIRST_HANDLE; handle <= LAST_HANDLE; ++handle) {
        if (handle != fileno(file) && fcntl(handle, F_GETFD) != -1)
            fprintf(file, "%d ", handle);
    }
    fputc(0, file);
    for (int i = 0; i < argc; ++i)
        fprintf(file, "%s%c", argv[i], 0);
    fputc(END_OF_RUN, file);
    if (fclose(file) != 0)
        broken("write " RECORDER_RECORD);
    return run;
}

/* Program and arguments joined by single blanks. */
static char *join(int argc, char **argv) {
    char *line = NULL;
    size_t size = 0;
    FILE *out = open_memstream(&line, &size);
    for (int i = 0; i < argc; ++i)
        fprintf(out, "%s%s", i == 0 ? "" : " ", argv[i]);
    fclose(out);
    return line;
}

/* Takes the next field; NULL at the end. */
static char *nextField(FILE *file) {
    char *field = NULL;
    size_t size = 0;
    return getdelim(&field, &size, 0, file) < 0 ? NULL : field;
}

/* Waits, and returns the exit status that the first rule that applies gives. What is allocated goes with the process.
 */
static int applyRules(long run, const char *line) {
    FILE *file = fopen(RECORDER_RULES, "re");
    if (file == NULL)
        broken(RECORDER_RULES);
    for (char *kind; (kind = nextField(file)) != NULL;) {
        char *value = nextField(file);
        char *status = nextField(file);
        char *message = nextField(file);
        if (message == NULL)
            broken("rule without end in " RECORDER_RULES);
        const long number = strtol(value, NULL, 10);
        if (strcmp(kind, "delay") == 0) {
            const struct timespec pause = {number / 1000, number % 1000 * 1000000};
            nanosleep(&pause, NULL);
        } else if (strcmp(kind, "at") == 0 ? number == run : strstr(line, value) != NULL) {
            if (*message != 0)
                fprintf(stderr, "%s\n", message);
            return (int)strtol(status, NULL, 10);
        }
    }
    return 0;
}

int main(int argc, char **argv) {
    const long run = record(argc, argv);
    return applyRules(run, join(argc, argv));
}
