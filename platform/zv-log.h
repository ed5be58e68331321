// Logging helpers shared by every module. Each line carries the prefix
// "file: function(line) > [TID:n] "; errors are red, notes green.
// The service client's sources (plugin/) log with the tag "zuvo-plugin" (set by their target).
#pragma once

#include <dlog.h>
#include <unistd.h>

#ifndef ZV_LOG_TAG
#define ZV_LOG_TAG "zuvo"
#endif

#define ZV_LOG_RED "\033[31m"
#define ZV_LOG_GREEN "\033[32m"
#define ZV_LOG_RESET "\033[0m"

#define ZV_LOG_AT(prio, fmt, ...)                                                                  \
    dlog_print(prio, ZV_LOG_TAG, "%s: %s(%d) > [TID:%d] " fmt, __FILE_NAME__, __func__, __LINE__,  \
               (int)gettid(), ##__VA_ARGS__)

// Entry lines and ordinary notes.
#define ZV_LOGI(fmt, ...) ZV_LOG_AT(DLOG_INFO, fmt, ##__VA_ARGS__)
#define ZV_LOGD(fmt, ...) ZV_LOG_AT(DLOG_DEBUG, fmt, ##__VA_ARGS__)
#define ZV_LOGW(fmt, ...) ZV_LOG_AT(DLOG_WARN, fmt, ##__VA_ARGS__)

// Errors, in red. ZV_LOGE_AS logs as the function named func, for a helper that checks or
// sets up on its caller's behalf.
#define ZV_LOGE_AS(func, fmt, ...)                                                                 \
    dlog_print(DLOG_ERROR, ZV_LOG_TAG, "%s: %s(%d) > " ZV_LOG_RED "[TID:%d] " fmt ZV_LOG_RESET,    \
               __FILE_NAME__, func, __LINE__, (int)gettid(), ##__VA_ARGS__)
#define ZV_LOGE(fmt, ...) ZV_LOGE_AS(__func__, fmt, ##__VA_ARGS__)

// Notes worth seeing, in green.
#define ZV_LOGG(fmt, ...)                                                                          \
    dlog_print(DLOG_INFO, ZV_LOG_TAG, "%s: %s(%d) > " ZV_LOG_GREEN "[TID:%d] " fmt ZV_LOG_RESET,   \
               __FILE_NAME__, __func__, __LINE__, (int)gettid(), ##__VA_ARGS__)

// The bare entry line most functions write.
#define ZV_LOG_ENTER() ZV_LOGI("")
