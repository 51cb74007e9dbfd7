// The logging macros: a line whose priority is filtered out evaluates none of
// its arguments; a line that passes is written with its text unchanged.
#define LOG_TAG "vok-log-test"
#include <gtest/gtest.h>

#include "log_capture.h"
#include "vok_log.h"

namespace {

const char* counted(int* calls, const char* text) {
    ++*calls;
    return text;
}

TEST(LogMacros, ArgumentsOfAFilteredLineAreNotEvaluated) {
    voktest::LogCapture log;
    int calls = 0;
    __android_log_set_minimum_priority(ANDROID_LOG_INFO);
    VOK_LOGD("debug %s", counted(&calls, "dropped"));
    VOK_LOGE("error %s", counted(&calls, "kept"));
    __android_log_set_minimum_priority(ANDROID_LOG_VERBOSE);
    VOK_LOGD("debug %s %d", counted(&calls, "kept"), 7);
    EXPECT_EQ(calls, 2);
    EXPECT_EQ(log.lines(),
              (std::vector<voktest::LogLine>{{LOG_TAG, ANDROID_LOG_ERROR, "error kept"},
                                             {LOG_TAG, ANDROID_LOG_DEBUG, "debug kept 7"}}));
}

}  // namespace
