#pragma once

// ResultCode: what a handler returns; the response writer turns it into the trailer word.
enum ResultCode : int {
    RC_OK = 0,
    RC_DECLINE = 1,  // not this table's command: the next table is tried
    RC_ERROR = 4,
    RC_NO_ANSWER = 5,
    RC_EMPTY_TRAILER = 6,
    RC_ATOK = 7,
    RC_ATNG = 8,
    RC_ATERROR = 9,
    RC_NOT_IMPLEMENTED = 101,
};

// Buffer sizes that are part of the behaviour (truncation limits).
constexpr int kLineSize = 2049;  // a received line plus its NUL, and the handler's copy
constexpr int kRespSize = 2048;  // a response body
constexpr int kTrailerSize = 64;
