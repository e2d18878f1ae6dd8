/* Compiled as C99 with warnings as errors: the C interface's header must stay plain C. */
#include "fileindex/fileindex_c.h"

int fileindex_c_header_check(void);
int fileindex_c_header_check(void) {
  int (*const getters[])(const char*, char*, int) = {FILEIDXQueuePathGet, FILEIDXDBPathGet};
  return getters[0] == getters[1];
}
