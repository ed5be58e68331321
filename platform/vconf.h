// Platform keys: small named values in files under $ZV_RUNTIME_DIR/vconf/, with change
// notifications delivered on the main loop. Thread safety: getters and setters from any
// thread; notifications are registered and delivered on the main loop.
#pragma once

#ifdef __cplusplus
extern "C" {
#endif

#define VCONF_OK 0
#define VCONF_ERROR -1

#define VCONFKEY_NETWORK_STATUS "memory/dnet/status"
#define VCONFKEY_NETWORK_CONFIGURATION_CHANGE_IND "memory/dnet/network_config"
#define VCONFKEY_NETWORK_IP "memory/dnet/ip"
#define VCONFKEY_NETWORK_PROXY "memory/dnet/proxy"

// Values of memory/dnet/status.
enum {
    VCONFKEY_NETWORK_OFF = 0,
    VCONFKEY_NETWORK_CELLULAR = 1,
    VCONFKEY_NETWORK_WIFI = 2,
};
// Values of memory/dnet/network_config.
enum {
    VCONFKEY_NETWORK_CLOSE = 0,
    VCONFKEY_NETWORK_ON = 1,
};

typedef enum {
    VCONF_TYPE_NONE = 0,
    VCONF_TYPE_STRING = 40,
    VCONF_TYPE_INT = 41,
} vconf_t;

typedef struct _keynode_t keynode_t;
typedef void (*vconf_callback_fn)(keynode_t *node, void *user_data);

int vconf_get_int(const char *in_key, int *intval);
// A new string the caller frees, or NULL.
char *vconf_get_str(const char *in_key);
int vconf_set_int(const char *in_key, const int intval);
int vconf_set_str(const char *in_key, const char *strval);

// cb runs on the main loop soon after the key's file changes, with a node describing
// the new value (valid during the call only).
int vconf_notify_key_changed(const char *in_key, vconf_callback_fn cb, void *user_data);
int vconf_ignore_key_changed(const char *in_key, vconf_callback_fn cb);

// A node's type is VCONF_TYPE_INT when its text is a decimal int, else VCONF_TYPE_STRING.
const char *vconf_keynode_get_name(keynode_t *keynode);
int vconf_keynode_get_type(keynode_t *keynode);
// The value of an int node; VCONF_ERROR for a string node.
int vconf_keynode_get_int(keynode_t *keynode);
// The node's text, whatever its type; owned by the node.
char *vconf_keynode_get_str(keynode_t *keynode);

// Host addition: 1 when key can name a key file (a relative path of plain names, none
// empty or starting with '.'), else 0.
int zv_vconf_key_valid(const char *key);

#ifdef __cplusplus
}
#endif
