#include "core/command_tables/tables.h"
#include "core/command_tables/handlers.h"

// Sensor table: offered every line second. Order matters: the first equal name wins, and a
// name may stand twice on purpose (the second row is reached only if the first declines).

// clang-format off
const CommandEntry sensor_table[] = {
    {"AT+QXZLJC", 36, gsensor_handler, nullptr},
    {"AT+QX_SNS_GRA", 36, gsensor_handler, nullptr},
    {"AT+QX_SNS_GRAV", 36, gsensor_handler, nullptr},
    {"AT+QXDZLP", 36, msensor_test_handler, nullptr},
    {"AT+QXHWKJ", 36, ps_test_handler, nullptr},
    {"AT+QX_SNS_INF", 36, ps_check_cover_handler, nullptr},
    {"AT+QX_IR_POLL_STATUS", 36, hw_poll_status_handler, nullptr},
    {"AT+QXGM", 36, als_test_handler, nullptr},
    {"AT+QXGM_CCT", 36, als_test_handler, nullptr},
    {"AT+QX_SNS_LGT", 36, als_lightsensor_handler, nullptr},
    {"AT+QX_SNS_LGT_UD", 36, als_lightsensor_handler, nullptr},
    {"AT+QX_SNS_LGT_UP", 36, als_lightsensor_handler, nullptr},
    {"AT+QXHWKJ_BACK", 36, ps_test_handler_back, nullptr},
    {"AT+QXGM_BACK", 36, als_test_handler_back, nullptr},
    {"AT+QXGM_CCT_BACK", 36, als_test_handler_back, nullptr},
    {"AT+QXTLY", 36, gyroscope_calibration_handler, nullptr},
    {"AT+QX_SNS_GYR", 36, gyroscope_calibration_handler, nullptr},
    {"AT+QX_SNS_WAVE", 36, sns_wave_handler, nullptr},
    {"AT+QX_INF_MAT", 36, lcm_sensor_board_suit_handler, nullptr},
    {"AT+QX_SNS_CCT", 36, cct_test_handler, nullptr},
    {"AT+QX_AUD_CTE", 36, ps_test_handler, nullptr},
    {"AT+EALT", 36, mic_echo_handler, nullptr},
    {"AT+QXXL", 36, play_ring_handler, nullptr},
    {"AT+QXPTS", 36, play_ring_handler, nullptr},
    {"AT+QXPTR", 36, play_ring_handler, nullptr},
    {"AT+QXFM", 36, fm_test_handler, nullptr},
    {"AT+QXMT", 36, echo_handler, nullptr},
    {"AT+QX_AUD_MIC", 36, multi_mic_handler, nullptr},
    {"AT+QXMTE", 36, dual_mic_to_headset_handler, nullptr},
    {"AT+QXMTER", 36, main_mic_to_headset_right_handler, nullptr},
    {"AT+QXVMTEL", 36, sub_mic_to_headset_left_handler, nullptr},
    {"AT+QXEMTS", 36, headset_to_speaker_handler, nullptr},
    {"AT+QXEMTR", 36, headset_to_earpiece_handler, nullptr},
    {"AT+QXEMTSR", 36, headset_to_right_speaker_handler, nullptr},
    {"AT+QXEMTSL", 36, headset_to_left_speaker_handler, nullptr},
    {"AT+QXEMTSA", 36, headset_to_speaker_with_gain_handler, nullptr},
    {"AT+QXEMTRA", 36, headset_to_earpiece_with_gain_handler, nullptr},
    {"AT+QXKTV", 36, ktv_test_handler, nullptr},
    {"AT+QXHIFI", 36, play_hifi_handler, nullptr},
    {"AT+QXPTRTS", 36, double_receiver_handler, nullptr},
    {"AT+QX_AUD_STM", 36, spk_mic_to_earpiece_handler, nullptr},
    {"AT+QX_AUD_RECD", 36, audio_record_handler, nullptr},
    {"AT+EADC", 36, adc_handler, nullptr},
    {"AT+QX_FSA_REG", 36, mcu_fsa_register_handler, nullptr},
    {"AT+QX_CHG_WPC", 36, wireless_charge_handler, nullptr},
    {"AT+QXDISRECHARGE", 36, no_charge_and_power_suplly_handler, nullptr},
    {"AT+QXMPPS", 36, get_mpps_value_handler, nullptr},
};
// clang-format on
const std::size_t sensor_table_rows = sizeof(sensor_table) / sizeof(sensor_table[0]);
