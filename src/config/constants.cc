#include "kolt/constants.h"

KOLT_C_BEGIN

const char* const configKey = "config";
const char* const controllersKey = "controllers";
const char* const mtimeKey = "mtime";
const char* const cfgSuffix = "cfg";
const char* const cfgxSuffix = "cfgx";
const char* const cfgpSuffix = "cfgp";
const char* const kVornAttributeRevision = "dsAttributeTypeNative:VornConfigRevision";
const char* const CFVornErrorDomain = "com.orvat.vorn.ErrorDomain";

KOLT_C_END
