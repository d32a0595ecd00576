#pragma once

// The device maker's utility library (libtarn-utils), as far as the disk manager uses it.

#ifdef __cplusplus
extern "C" {
#endif

// The router's model, or null when it is not known. The text belongs to the library; it stays valid
// until the next call.
const char* tarn_get_model(void);

// Writes into `buf` a short text that identifies the SD-card slot within the kernel's device paths,
// with its terminating zero. A router without a slot leaves `buf` as it is.
// REQUIRES: room for 16 characters.
void get_device_microsd(char* buf);

#ifdef __cplusplus
}
#endif
