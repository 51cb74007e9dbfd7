#ifndef VOK_LOG_H
#define VOK_LOG_H

#include <android/log.h>

// Each source file defines LOG_TAG before including this header; the tags are
// part of the library's observable behaviour.
//
// A line whose priority is filtered out costs the priority test and nothing
// more: its arguments are not evaluated and nothing is formatted. The test is
// the one __android_log_print makes itself (ANDROID_LOG_VERBOSE as the default
// priority), so exactly the same lines are written, with the same texts.
#define VOK_LOG_AT(priority, ...)                                                     \
    do {                                                                              \
        if (__android_log_is_loggable((priority), LOG_TAG, ANDROID_LOG_VERBOSE) != 0) \
            __android_log_print((priority), LOG_TAG, __VA_ARGS__);                    \
    } while (0)
#define VOK_LOGD(...) VOK_LOG_AT(ANDROID_LOG_DEBUG, __VA_ARGS__)
#define VOK_LOGE(...) VOK_LOG_AT(ANDROID_LOG_ERROR, __VA_ARGS__)

#endif
