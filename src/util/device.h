// The router itself: what the maker's platform library tells of it, its firewall and its share.
#pragma once

// The router's model text, cut to size - 1 characters. 0, or 1 when the library gives none.
int device_get_model(char* out, int size);

// Always 1: every model is treated alike.
int device_model_check();

// The text that stands in the kernel's device path of the SD card reader; empty on a router without
// one. size is at least 16. 0, or 1 for a null buffer.
int device_get_sdcard_point(char* out, int size);

// Reloads the firewall. Always 0.
int firewall_reload();

// Points the last samba share at the mount base and restarts samba. Always 0.
int samba_share_mountd();

// Place for preparation that a particular device needs at start-up. Always 0.
int init_hook();
