// SPDX-License-Identifier: MIT
/* Runs a command and reports what it took: its peak resident set (the
 * largest of it and of everything it waited for) in KiB and its wall-clock
 * time in seconds, so that a test can hold a program to limits of memory and
 * time. A child starts out with the peak of the process it was forked from,
 * so that process is this small one, built without sanitizers, and not the
 * test itself.
 *
 *   kolvrand-measure REPORT COMMAND [ARG...]
 *
 * writes "KIB SECONDS\n" to REPORT and exits as the command did (128 + the
 * signal when a signal ended it). */
#include <stdio.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>

int main(int argc, char** argv) {
  if (argc < 3) {
    fprintf(stderr, "usage: kolvrand-measure REPORT COMMAND [ARG...]\n");
    return 125;
  }
  struct timespec start, end;
  clock_gettime(CLOCK_MONOTONIC, &start);
  const pid_t pid = fork();
  if (pid < 0) return 126;
  if (pid == 0) {
    execvp(argv[2], argv + 2);
    _exit(127);
  }
  int status = 0;
  while (waitpid(pid, &status, 0) < 0) {
  }
  clock_gettime(CLOCK_MONOTONIC, &end);
  struct rusage usage;
  getrusage(RUSAGE_CHILDREN, &usage);
  FILE* report = fopen(argv[1], "w");
  if (!report) return 126;
  fprintf(report, "%ld %.3f\n", usage.ru_maxrss,
          (double)(end.tv_sec - start.tv_sec) + (double)(end.tv_nsec - start.tv_nsec) / 1e9);
  fclose(report);
  return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}
