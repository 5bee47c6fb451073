/* A C program links against libkolt.so and sees the exported constants. */
#include <stdio.h>
#include <string.h>

#include "kolt/constants.h"
#include "kolt/controller_helpers.h"
#include "kolt/log.h"

static int captured;
static void capture(int priority, const char* line, void* context) {
  (void)context;
  if (priority == 13 && strcmp(line, "vornd: [7] ERROR: from C") == 0) captured = 1;
}

int main(void) {
  if (strcmp(configKey, "config") != 0 || strcmp(controllersKey, "controllers") != 0 ||
      strcmp(mtimeKey, "mtime") != 0 || strcmp(cfgSuffix, "cfg") != 0 ||
      strcmp(cfgxSuffix, "cfgx") != 0 || strcmp(cfgpSuffix, "cfgp") != 0 ||
      strcmp(kVornAttributeRevision, "dsAttributeTypeNative:VornConfigRevision") != 0 ||
      strcmp(CFVornErrorDomain, "com.orvat.vorn.ErrorDomain") != 0) {
    fprintf(stderr, "constant mismatch\n");
    return 1;
  }
  kolt_set_log_handler(capture, NULL);
  if (log_message(7, "from C") != '\n' || !captured) {
    fprintf(stderr, "log_message did not reach the handler\n");
    return 1;
  }
  {
    /* The address lookup is callable from C; a NULL address is refused. */
    char host[8] = "";
    if (vorn_controller_from_ip(NULL, host, sizeof host) != 1) {
      fprintf(stderr, "vorn_controller_from_ip accepted NULL\n");
      return 1;
    }
  }
  kolt_set_log_handler(NULL, NULL);
  return 0;
}
