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

/* Waits, and returns the exit status that the first rule that applies gives. */
static int applyRules(long run, const char *line) {
    FILE *file = fopen(RECORDER_RULES, "re");
    if (file == NULL)
        broken(RECORDER_RULES);
    struct timespec pause = {0, 0};
    char part[1024], message[1024];
    int status = 0;
    for (long number; fscanf(file, RECORDER_RULE_FORMAT, &number, &status, &pause.tv_nsec, part, message) == 5;) {
        if ((number != 0 && number != run) || strstr(line, part) == NULL)
            continue;
        nanosleep(&pause, NULL);
        if (message[1] != 0)
            fprintf(stderr, "%s\n", message + 1);
        if (status != 0)
            return status;
    }
    return 0;
}

int main(int argc, char **argv) {
    const long run = record(argc, argv);
    char *line = NULL; /* program and arguments joined by single blanks */
    size_t size = 0;
    FILE *out = open_memstream(&line, &size);
    for (int i = 0; i < argc; ++i)
        fprintf(out, "%s%s", i == 0 ? "" : " ", argv[i]);
    fclose(out);
    return applyRules(run, line);
}
