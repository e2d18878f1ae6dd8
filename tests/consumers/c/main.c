/* A C99 program built against an installed libfileindex through pkg-config alone. It calls the C
 * interface with arguments refused before any file is read, so it runs on any machine. */
#include <fileindex/fileindex_c.h>
#include <stdio.h>

int main(void) {
  char out[8] = "";
  const int ok = FILEIDXQueuePathGet(NULL, out, (int)sizeof out) == -1 &&
                 FILEIDXDBPathGet("photo", out, 0) == -1 && FILEIDXIsFullPathIndexed(NULL) == 0 &&
                 FILEIDXIsPathIndexed(NULL) == 0 && FILEIDXIsShareIndexed(NULL) == 0;
  puts(ok ? "c consumer: ok" : "c consumer: a call of the C interface answered wrong");
  return ok ? 0 : 1;
}
