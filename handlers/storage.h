#pragma once
// The storage family's worker: after AT+QX_OTG_DEV=1 it looks once a second for a USB
// stick or keyboard on the OTG port and reports through the property "sys.otg.dev".

// arg is a heap int holding the number of tries; the worker frees it and detaches itself.
void *otg_device_check_thread(void *seconds);

// Workers of AT+QX_OTG_DEV=1 that have not ended yet (they cannot be stopped; a test or a
// shutdown waits for them).
int otg_checks_running();
