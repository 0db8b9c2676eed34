#pragma once
// The maker's audio factory-test library: loopback paths, numbered test cases (tone and
// file playback, recording, multi-microphone), headset detection and the smart power
// amplifier. Every call returns 0 on success unless its comment says otherwise; gains
// and volumes are percentages, 100 being the default. The layer is initialised once at
// start-up with at_set_audio_init_ftm() (platform/factory.h).

extern "C" {

// ---- loopback paths: each start has its exit
int startMainEchoTest(void);
int exitMainEchoTest(void);
int startSubEchoTest(void);
int exitSubEchoTest(void);
int startReceiveTest(int gain);
int exitReceiveTest(void);
int startSendTest(int gain);
int exitSendTest(void);
int startHeadsetEchoTest(void);
int exitHeadsetEchoTest(void);
int startMic2headset(int gain);
int exitMic2headset(void);
int startMain2headsetR(int gain);
int exitMain2headsetR(void);
int startSub2headsetL(int gain);
int exitSub2headsetL(void);
int startHeadset2speaker(int gain);
int exitHeadset2speaker(void);
int startHeadset2earpiece(int gain);
int exitHeadset2earpiece(void);
int startHeadset2SpeakerWithGain(int gain1, int gain2);
int exitHeadset2SpeakerWithGain(void);
int startHeadset2EarpieceWithGain(int gain1, int gain2);
int exitHeadset2EarpieceWithGain(void);
int startHeadset2RightSpeaker(int gain);
int exitHeadset2RightSpeaker(void);
int startHeadset2LeftSpeaker(int gain);
int exitHeadset2LeftSpeaker(void);

// ---- numbered test cases
// Starts (enable 1) or stops (enable 0) a test case; path names the file to play for
// the cases that play one. 0 on success, otherwise an error number.
int audio_ftm_process(int test_case, int enable, int volume, const char *path = nullptr);
int audio_ftm_process_full(int test_case, int enable, int volume, const char *path);

// ---- headset
int ftm_mbhc_get_hp_type(void);  // 0 none detected, 1 standard, 2 not standard
int ftm_mbhc_mos_test(void);     // headset switch test: 1 pass, 0 fail, -1 error

// ---- smart power amplifier
int get_smartpa_manufacturer(void);  // maker number; 0 is the maker whose reset is offered
// Calibrates the speaker amplifier and leaves a result text in text (len bytes).
int smartpa_calibrate(char *text, int len);
int smartpa_check_mtpex(void);  // calibration status (>= 0), negative on error
int smartpa_reset_mtpex(void);  // >= 0 on success

}  // extern "C"
