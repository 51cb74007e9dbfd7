#ifndef VOK_LOG_H
#define VOK_LOG_H

#include <android/log.h>

// Each source file defines LOG_TAG before including this header; the tags are
// part of the library's observable behaviour.
#define VOK_LOGD(...) __android_log_print(ANDROID_LOG_DEBUG, LOG_TAG, __VA_ARGS__)
#define VOK_LOGE(...) __android_log_print(ANDROID_LOG_ERROR, LOG_TAG, __VA_ARGS__)

#endif
