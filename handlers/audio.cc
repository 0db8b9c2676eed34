// Audio path tests.
// Not built yet: every handler of this family answers "Not Implement" (101) until it is.
#include "core/command_tables/handlers.h"
#include "core/result.h"

// clang-format off
int mic_echo_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int play_ring_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int fm_test_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int echo_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int multi_mic_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int dual_mic_to_headset_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int main_mic_to_headset_right_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int sub_mic_to_headset_left_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int headset_to_speaker_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int headset_to_earpiece_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int headset_to_right_speaker_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int headset_to_left_speaker_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int headset_to_speaker_with_gain_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int headset_to_earpiece_with_gain_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int ktv_test_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int play_hifi_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int double_receiver_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int spk_mic_to_earpiece_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int audio_record_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int smart_speaker_Amplifier_calibrate_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int headset_type_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
// clang-format on
