#ifndef VOK_EXPORT_H
#define VOK_EXPORT_H

// Everything is hidden by default; only names marked with this macro leave the
// shared library.
#define VOK_EXPORT __attribute__((visibility("default")))

#ifdef __cplusplus
#define VOK_EXTERN_C extern "C"
#else
#define VOK_EXTERN_C
#endif

#define VOK_C_API VOK_EXTERN_C VOK_EXPORT

#endif
