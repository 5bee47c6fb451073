/* Every C-linkage header of kolt compiles as strict C99 on its own. */
#include "kolt/build.h"
#include "kolt/constants.h"
#include "kolt/controller_helpers.h"
#include "kolt/export.h"
#include "kolt/log.h"

int kolt_c_headers_check(void);
int kolt_c_headers_check(void) {
  kolt_log_handler handler = 0;
  int (*build)(const char*, const char*, const char*, char**) = buildSanConfigC;
  (void)handler;
  (void)build;
  return configKey[0] == 'c';
}
