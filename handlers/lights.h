#pragma once
// Vibrator and indicator-light workers and the flags that stop them. The flags are plain
// integers that the handlers write and the workers read once per pass, without a lock.

extern int g_vibrator_run;   // set while a vibration worker runs (AT+EDFT=6,x, AT+QX_VBR_STH_TS)
extern int g_lights_run;     // set while the indicator blink runs (AT+QXLIGHT)
extern int g_panel_test;     // set by AT+EDFT=0,5 in AT mode, cleared by AT+EDFT=0,0
// The LED ring's calibration mode: -1 calibration not set, -2 brightness not set, 7 or 3
// after AT+QX_RING_LGT=6 or =7; 0 until one of those forms has run.
extern int g_ring_mode;

// A 10-second vibration pulse, then a sleep of 10100000 seconds: in effect one pulse
// and a thread that waits for ever (the long sleep is how the worker has always behaved).
void *update_vibrator_thread(void *);
// Pulses of on ms every on + interval ms for at most 20 s; arg is an int[2] {on, interval}
// allocated with new[] and freed by the worker.
void *instant_vibrate_thread(void *arg);
// Blinks red and green in turn every 500 ms while g_lights_run is set.
void *update_indicate_lights_thread(void *);
