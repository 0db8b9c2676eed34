#pragma once
// Battery and charger sampling shared beyond its own commands: the thermal-zone filter of
// the temperature answers, and the count of sampling workers still alive.
#include <cstddef>

// Appends one thermal zone's raw temperature text (millidegrees) to line (size bytes),
// formatted with the zone's label format ("MSM_THERM:%.1f,"). A zone reporting -40
// degrees has no sensor fitted and is left out: returns false and appends nothing.
bool append_ntc_value(char *line, size_t size, const char *raw, const char *label_format);

// Sampling workers (EADC, BATADC, VBUS) that have not ended yet. Their stop forms only
// clear a flag; this tells when the last sample has really been taken.
int sampling_workers_alive();
