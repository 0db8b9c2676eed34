#pragma once
// The phone's recorder behind the audio library's recording test cases.
namespace sim {

// The file a recording test case (51 to 55) writes; nullptr for any other case.
const char *recorder_file(int test_case);
// A recording starts: an empty WAV file is laid down and the start time noted.
void recorder_start(int test_case);
// The recording ends: the file gets the samples of the time since its start.
void recorder_stop(int test_case);

}  // namespace sim
