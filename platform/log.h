#pragma once
// Every log line goes to the Android log under one tag, prefixed with the source line
// and the function, so a line engineer can find the spot from a logcat capture.
#include <android/log.h>

#define FTCMD_LOG_TAG "EM_LOG: FTCMD"

#define FT_LOG(prio, tag, fmt, ...) \
    __android_log_print(prio, tag, "%d:%s(): " fmt, __LINE__, __func__, ##__VA_ARGS__)

#define LOGD(fmt, ...) FT_LOG(ANDROID_LOG_DEBUG, FTCMD_LOG_TAG, fmt, ##__VA_ARGS__)
#define LOGI(fmt, ...) FT_LOG(ANDROID_LOG_INFO, FTCMD_LOG_TAG, fmt, ##__VA_ARGS__)
#define LOGW(fmt, ...) FT_LOG(ANDROID_LOG_WARN, FTCMD_LOG_TAG, fmt, ##__VA_ARGS__)
#define LOGE(fmt, ...) FT_LOG(ANDROID_LOG_ERROR, FTCMD_LOG_TAG, fmt, ##__VA_ARGS__)

// The battery, charging and sampling handlers have always logged under their own tag, and
// the line engineers' logcat filters look for it.
#define EM_LOG_TAG "EM_LOG"
#define EM_LOGD(fmt, ...) FT_LOG(ANDROID_LOG_DEBUG, EM_LOG_TAG, fmt, ##__VA_ARGS__)
#define EM_LOGI(fmt, ...) FT_LOG(ANDROID_LOG_INFO, EM_LOG_TAG, fmt, ##__VA_ARGS__)
#define EM_LOGW(fmt, ...) FT_LOG(ANDROID_LOG_WARN, EM_LOG_TAG, fmt, ##__VA_ARGS__)
#define EM_LOGE(fmt, ...) FT_LOG(ANDROID_LOG_ERROR, EM_LOG_TAG, fmt, ##__VA_ARGS__)
