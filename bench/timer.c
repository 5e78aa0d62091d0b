/* timer ROUNDS PROGRAM... [-- PATH TEXT...]: starts the programs in turn, ROUNDS times each, by
 * vfork from this small process, and prints for each the median of the wall time from the vfork to
 * the end, in microseconds, and of the page faults. Before a start each PATH becomes a link with
 * TEXT, or nothing where TEXT is empty. The programs' standard error is closed to the terminal. */
#define _GNU_SOURCE
#include <fcntl.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>

static double now(void) {
    struct timespec time;
    clock_gettime(CLOCK_MONOTONIC, &time);
    return time.tv_sec * 1e6 + time.tv_nsec / 1e3;
}

static int ascending(const void* left, const void* right) {
    return (*(const double*)left > *(const double*)right) -
           (*(const double*)left < *(const double*)right);
}

int main(int count, char** arguments) {
    const int rounds = atoi(arguments[1]);
    int programs = 2;
    while (programs < count && strcmp(arguments[programs], "--") != 0) {
        ++programs;
    }
    double* const times = malloc(sizeof(double) * rounds * count);
    double* const faults = malloc(sizeof(double) * rounds * count);
    dup2(open("/log", O_WRONLY | O_CREAT | O_TRUNC, 0644), STDERR_FILENO);

    for (int round = 0; round < rounds; ++round) {
        for (int program = 2; program < programs; ++program) {
            for (int link = programs + 1; link + 1 < count; link += 2) {
                unlink(arguments[link]);
                if (*arguments[link + 1] != '\0' && symlink(arguments[link + 1], arguments[link])) {
                    return 1;
                }
            }
            int status = 0;
            struct rusage used;
            const double start = now();
            const pid_t child = vfork();
            if (child == 0) {
                execl(arguments[program], arguments[program], (char*)NULL);
                _exit(127);
            }
            if (wait4(child, &status, 0, &used) != child || status != 0) {
                return 1;
            }
            times[program * rounds + round] = now() - start;
            faults[program * rounds + round] = (double)used.ru_minflt;
        }
    }
    for (int program = 2; program < programs; ++program) {
        qsort(times + program * rounds, rounds, sizeof(double), ascending);
        qsort(faults + program * rounds, rounds, sizeof(double), ascending);
        printf("%.0f %.0f\n", times[program * rounds + rounds / 2],
            faults[program * rounds + rounds / 2]);
    }
    return 0;
}
