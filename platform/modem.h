#pragma once
// Requests to the modem's engineering-mode service (made through the factory support
// library), and the RF front end's antenna switch.
#include <cstdint>

// An EM status reply buffer is at least this large and zero-filled before the call.
#define ZDR_EM_REPLY_SIZE 256
// A GPS reply buffer (options 2, 5 and 6) holds at most this many bytes of text.
#define ZDR_GPS_REPLY_SIZE 512

// GPS request: option 0 close, 1 open, 3 open in the second mode, 2 read the running
// values, 5 and 6 read a result.
typedef struct zdr_gps_option_req {
    int option;
} zdr_gps_option_req;

extern "C" {

// Sends the numbered EM status request and copies the modem's reply text into reply
// (ZDR_EM_REPLY_SIZE bytes). 0 when the request was delivered; the request itself
// succeeded when, in addition, the reply begins with "0".
int qmi_zdr_set_em_status(int request, char *reply);
// Modem NV items. request holds the 32-bit item number followed by its data area.
// A read leaves the item's value as a 32-bit integer at the start of reply (len bytes,
// at least 4); a write stores len bytes of the data area. 0 on success.
int qmi_zdr_read_nv_msg(const void *request, void *reply, int len);
int qmi_zdr_write_nv_msg(const void *request, int len);
// Sends a GPS request; reply (ZDR_GPS_REPLY_SIZE bytes, or NULL when none is wanted)
// receives the text of options 2, 5 and 6. 0 on success.
int qmi_zdr_gps_option_msg(const zdr_gps_option_req *request, char *reply);

// Sets the DPDT antenna switch: 0 normal, 1 crossed. 0 on success.
int dpdt_normal_or_cross(int cross);

}  // extern "C"
