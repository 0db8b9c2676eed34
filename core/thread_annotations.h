#pragma once
// Clang's thread-safety attributes, so that -Wthread-safety checks which state the
// dispatch lock guards. Other compilers see nothing.
#if defined(__clang__)
#define FTCMD_TSA(x) __attribute__((x))
#else
#define FTCMD_TSA(x)
#endif

#define CAPABILITY(x) FTCMD_TSA(capability(x))
#define GUARDED_BY(x) FTCMD_TSA(guarded_by(x))
#define REQUIRES(...) FTCMD_TSA(requires_capability(__VA_ARGS__))
#define ACQUIRE(...) FTCMD_TSA(acquire_capability(__VA_ARGS__))
#define RELEASE(...) FTCMD_TSA(release_capability(__VA_ARGS__))
#define EXCLUDES(...) FTCMD_TSA(locks_excluded(__VA_ARGS__))
#define NO_THREAD_SAFETY_ANALYSIS FTCMD_TSA(no_thread_safety_analysis)
