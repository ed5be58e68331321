// Network state monitor: reads the platform's memory/dnet/ keys on demand and turns their
// changes into calls of the three callbacks the upload controller registers.
// Thread safety: main loop only; the callbacks run on the main loop.
#pragma once

// Connection kind as handed to the controller (numbered unlike the platform's status key).
typedef enum {
    ZV_NETWORK_TYPE_NONE = 0,
    ZV_NETWORK_TYPE_WIFI = 1,
    ZV_NETWORK_TYPE_CELLULAR = 2,
} ZvNetworkType;

// state: 1 when memory/dnet/network_config is 1, else 0.
typedef void (*zv_ext_network_onoff_cb)(int state, void *userp);
// type: a ZvNetworkType.
typedef void (*zv_ext_network_status_cb)(int type, void *userp);
// ip, proxy: fresh copies (either may be NULL) that the receiver frees.
typedef void (*zv_ext_network_config_cb)(char *ip, char *proxy, void *userp);

// Watches memory/dnet/network_config (on/off, then configuration) and memory/dnet/status, and
// stores the callbacks when all three watches were made. With ZV_NETWORK=host (the default)
// it first brings the keys in line with the host's network and keeps them so.
int zv_ext_network_register(void *userp, zv_ext_network_onoff_cb onoff_cb,
                            zv_ext_network_status_cb status_cb, zv_ext_network_config_cb config_cb);
// Forgets the callbacks (the watches stay); always true.
int zv_ext_network_deregister(void);
// True when a cellular or Wi-Fi connection exists.
int zv_ext_network_check(void);
// The key's value, a copy the caller frees, or NULL.
char *zv_ext_network_get_ip(void);
char *zv_ext_network_get_proxy(void);
