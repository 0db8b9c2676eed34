#include "core/command_tables/tables.h"
#include "core/command_tables/handlers.h"

// Modem table: offered every line first. Order matters: the first equal name wins, and a
// name may stand twice on purpose (the second row is reached only if the first declines).

// clang-format off
const CommandEntry modem_table[] = {
    {"AT+EMBT", 36, bt_handler, nullptr},
    {"AT+QXWLAN", 36, wifi_handler, nullptr},
    {"AT+QXWANT", 36, wifi_antsel_handler, nullptr},
    {"AT+QXGPS", 36, gps_handler, nullptr},
    {"AT+QXWMAC", 36, wlan_addr_handler, nullptr},
    {"AT+EGMR", 36, imei_and_pcb_code_on_handler, nullptr},
    {"AT+QXSIMT", 36, set_sim2_status_handler, nullptr},
    {"AT+QXTDNV", 36, nv_66024_handler, nullptr},
    {"AT+QXZFTX", 36, primary_or_diversity_handler, nullptr},
    {"AT+QXMEID", 36, meid_code_handler, nullptr},
    {"AT+QXSYS", 36, change_sig_system_handler, nullptr},
    {"AT+QX_XO_TRIM", 36, change_sig_system_handler, nullptr},
    {"AT+QX_XO_C0", 36, change_sig_system_handler, nullptr},
    {"AT+QXEFS", 36, efs_golden_copy_handler, nullptr},
    {"AT+QX_CHECK_PERSIST", 36, check_persist_handler, nullptr},
    {"AT+QXVSIM", 36, virtual_sim_handler, nullptr},
    {"AT+QXDPDT", 36, set_dpdt_status_handler, nullptr},
    {"AT+QX_ANT_DEF", 36, set_dpdt_status_handler, nullptr},
    {"AT+QXSMT_DEFAULT_ANT", 36, set_dpdt_status_handler, nullptr},
    {"AT+QX_DRX_OPT", 36, set_antenna_diversity_status_handler, nullptr},
    {"AT+QXSAR", 36, sar_handler, nullptr},
    {"AT+ONLINE", 36, check_online_status_handler, nullptr},
    {"AT+QXCOMP", 36, complete_handler, nullptr},
    {"AT+QX_SNS_SAR", 36, sar_test_handler, nullptr},
    {"AT+QX_RF_SAR", 36, sar_connection_handler, nullptr},
    {"AT+QXTS", 36, qcom_check_card_slot_status_handler, nullptr},
    {"AT+QX_SIM_SLOT", 36, qcom_check_card_slot_status_handler, nullptr},
    {"AT+QX_TFC_SLOT", 36, qcom_check_card_slot_status_handler, nullptr},
    {"AT+QX_MODEM_REBOOT", 36, qcom_set_modem_reboot_handler, nullptr},
    {"AT+QX_CCM_PM", 36, pm8008_check_handler, nullptr},
};
// clang-format on
const std::size_t modem_table_rows = sizeof(modem_table) / sizeof(modem_table[0]);
