/* A C99 program built against an installed libfileindex through pkg-config alone. It calls every
 * function of the C interface with arguments the library refuses before it reads any file, so it
 * runs on any machine without touching the appliance's configuration. */
#include <fileindex/fileindex_c.h>
#include <stdio.h>

int main(void) {
  char out[8] = "";
  const struct {
    const char* call;
    int result;
    int want;
  } cases[] = {
      {"FILEIDXQueuePathGet(NULL)", FILEIDXQueuePathGet(NULL, out, (int)sizeof out), -1},
      {"FILEIDXDBPathGet(no room)", FILEIDXDBPathGet("photo", out, 0), -1},
      {"FILEIDXIsFullPathIndexed(NULL)", FILEIDXIsFullPathIndexed(NULL), 0},
      {"FILEIDXIsPathIndexed(NULL)", FILEIDXIsPathIndexed(NULL), 0},
      {"FILEIDXIsShareIndexed(NULL)", FILEIDXIsShareIndexed(NULL), 0},
  };
  int failed = 0;
  for (size_t i = 0; i < sizeof cases / sizeof cases[0]; i++) {
    if (cases[i].result != cases[i].want) {
      fprintf(stderr, "%s = %d, want %d\n", cases[i].call, cases[i].result, cases[i].want);
      failed = 1;
    }
  }
  if (!failed) {
    puts("c consumer: ok");
  }
  return failed;
}
