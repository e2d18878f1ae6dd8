/* The questions of the C interface asked the way a C program asks them. */
#include "c_queries_check.h"

#include <stdio.h>

#include "fileindex/fileindex_c.h"

struct Question {
  const char* function;
  int (*ask)(const char*);
  const char* argument; /* a full path is written relative to the volume, starting with '/' */
  int fullPath;
  int expected;
};

static const struct Question kQuestions[] = {
    {"FILEIDXIsPathIndexed", FILEIDXIsPathIndexed, "/photo", 0, 1},
    {"FILEIDXIsPathIndexed", FILEIDXIsPathIndexed, "/photo/2016/a.jpg", 0, 1},
    {"FILEIDXIsPathIndexed", FILEIDXIsPathIndexed, "/photos", 0, 0},
    {"FILEIDXIsPathIndexed", FILEIDXIsPathIndexed, "/photo/", 0, 1},
    {"FILEIDXIsPathIndexed", FILEIDXIsPathIndexed, "/video", 0, 0},
    {"FILEIDXIsPathIndexed", FILEIDXIsPathIndexed, "", 0, 0},
    {"FILEIDXIsFullPathIndexed", FILEIDXIsFullPathIndexed, "/video/clips/x", 1, 1},
    {"FILEIDXIsFullPathIndexed", FILEIDXIsFullPathIndexed, "/video/clip", 1, 0},
    {"FILEIDXIsFullPathIndexed", FILEIDXIsFullPathIndexed, "/photo", 0, 0},
    {"FILEIDXIsFullPathIndexed", FILEIDXIsFullPathIndexed, "/etc/passwd", 0, 0},
    {"FILEIDXIsShareIndexed", FILEIDXIsShareIndexed, "video", 0, 1},
    {"FILEIDXIsShareIndexed", FILEIDXIsShareIndexed, "vid", 0, 0},
    {"FILEIDXIsShareIndexed", FILEIDXIsShareIndexed, "/video", 0, 0},
    {"FILEIDXIsShareIndexed", FILEIDXIsShareIndexed, NULL, 0, 0},
};

int CheckCQueries(const char* volume) {
  int wrong = 0;
  size_t i;
  for (i = 0; i < sizeof kQuestions / sizeof kQuestions[0]; ++i) {
    const struct Question* q = &kQuestions[i];
    char full[4096];
    const char* argument = q->argument;
    int answer;
    if (q->fullPath) {
      (void)snprintf(full, sizeof full, "%s%s", volume, q->argument);
      argument = full;
    }
    answer = q->ask(argument);
    if (answer != q->expected) {
      (void)fprintf(stderr, "%s(\"%s\") = %d, expected %d\n", q->function,
                    argument != NULL ? argument : "(null)", answer, q->expected);
      ++wrong;
    }
  }
  return wrong;
}
