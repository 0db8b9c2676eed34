// ADC, voltage and temperature sampling.
// Not built yet: every handler of this family answers "Not Implement" (101) until it is.
#include "core/command_tables/handlers.h"
#include "core/result.h"

// clang-format off
int adc_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int adc_register_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int usb_voltage_sample_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int batadc_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
// clang-format on
