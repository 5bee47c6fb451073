// Everything kolt exports, for callers that want one include.
#ifndef KOLT_KOLT_H
#define KOLT_KOLT_H

#include "kolt/constants.h"
#include "kolt/controller_helpers.h"
#include "kolt/directory.h"
#include "kolt/env.h"
#include "kolt/error.h"
#include "kolt/export.h"
#include "kolt/local_config.h"
#include "kolt/log.h"
#include "kolt/plist.h"
#include "kolt/volume_files.h"

#endif  // KOLT_KOLT_H
