/*
 * Symbol visibility and linkage for the appliance libraries.
 *
 * The library is compiled with hidden visibility; only what is marked ORLO_EXPORT is
 * reachable from liborloiscsiep.so.  Every exported function has C linkage so that
 * the appliance's C and C++ programs can both link it.
 */
#ifndef ORLO_EXPORT_H
#define ORLO_EXPORT_H

#define ORLO_EXPORT __attribute__((visibility("default")))

#ifdef __cplusplus
#define ORLO_EXTERN_C_BEGIN extern "C" {
#define ORLO_EXTERN_C_END }
#else
#define ORLO_EXTERN_C_BEGIN
#define ORLO_EXTERN_C_END
#endif

#endif
