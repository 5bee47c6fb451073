/* Exported read-only strings: the keys, suffixes and names that callers share
 * with the library. C linkage; valid C99. Each holds NUL-terminated UTF-8. */
#ifndef KOLT_CONSTANTS_H
#define KOLT_CONSTANTS_H

#include "kolt/export.h"

KOLT_C_BEGIN

/* "config": a volume entry's parsed configuration. */
KOLT_EXPORT extern const char* const configKey;
/* "controllers": a volume entry's hosting controllers, and the globals' table. */
KOLT_EXPORT extern const char* const controllersKey;
/* "mtime": a volume entry's configuration-file modification date. */
KOLT_EXPORT extern const char* const mtimeKey;
/* "cfg", "cfgx", "cfgp": the volume configuration file suffixes. */
KOLT_EXPORT extern const char* const cfgSuffix;
KOLT_EXPORT extern const char* const cfgxSuffix;
KOLT_EXPORT extern const char* const cfgpSuffix;
/* "dsAttributeTypeNative:VornConfigRevision": a native directory attribute
 * name for the configuration's revision. No operation of kolt uses it. */
KOLT_EXPORT extern const char* const kVornAttributeRevision;
/* "com.orvat.vorn.ErrorDomain": the library's own error domain. */
KOLT_EXPORT extern const char* const CFVornErrorDomain;

KOLT_C_END

#endif /* KOLT_CONSTANTS_H */
