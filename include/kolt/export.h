/* Symbol visibility and C linkage helpers for kolt's public headers.
 *
 * The library is built with hidden visibility; only declarations marked
 * KOLT_EXPORT are part of libkolt.so's interface. This header is valid C99. */
#ifndef KOLT_EXPORT_H
#define KOLT_EXPORT_H

#if defined(KOLT_BUILDING_LIBRARY)
#define KOLT_EXPORT __attribute__((visibility("default")))
#else
#define KOLT_EXPORT
#endif

#ifdef __cplusplus
#define KOLT_C_BEGIN extern "C" {
#define KOLT_C_END }
#else
#define KOLT_C_BEGIN
#define KOLT_C_END
#endif

#endif /* KOLT_EXPORT_H */
