#pragma once
// The audio family's one piece of process state: which audio test path is open.
#include <atomic>

// 0 when no audio test path is open, otherwise the number of the path opened last. Every
// open sets it before calling the library (so a failed open stays set) and every close
// clears it before calling the library. Handlers change it under the dispatch mutex; the
// hang-up path of the transports runs "AT+QXMT=1,0" without that mutex, so the value is
// atomic rather than a plain int.
extern std::atomic<int> g_audio_test_state;
