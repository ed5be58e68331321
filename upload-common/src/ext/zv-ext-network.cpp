// Network state monitor: watches the memory/dnet/ platform keys and hands their changes to
// the controller's three callbacks; with ZV_NETWORK=host the host's network is written into
// those keys first (platform/net_monitor).
#include "zv-ext-network.h"

#include <net_monitor.h>
#include <stdlib.h>
#include <string.h>
#include <vconf.h>

#include "zv-log.h"

namespace
{

struct NetworkCallbacks {
    zv_ext_network_onoff_cb onoff = nullptr;
    zv_ext_network_status_cb status = nullptr;
    zv_ext_network_config_cb config = nullptr;
};

NetworkCallbacks g_callbacks;

// The shared tests of every watcher: true when node is a notification of own_key.
bool watcher_accepts(keynode_t *node, void *userp, const char *own_key)
{
    if (!userp) {
        ZV_LOGE("userp is NULL");
        return false;
    }
    if (!node) {
        ZV_LOGE("Key node is NULL");
        return false;
    }
    const char *name = vconf_keynode_get_name(node);
    if (!name) {
        ZV_LOGE("Key value is NULL");
        return false;
    }
    if (strcmp(name, own_key) != 0) {
        ZV_LOGI("invalid key name");
        return false;
    }
    return true;
}

} // namespace

static void _zv_ext_network_onoff_status_cb(keynode_t *node, void *userp)
{
    ZV_LOG_ENTER();
    if (!watcher_accepts(node, userp, VCONFKEY_NETWORK_CONFIGURATION_CHANGE_IND))
        return;
    int state = 0;
    switch (vconf_keynode_get_int(node)) {
    case VCONFKEY_NETWORK_CLOSE:
        ZV_LOGI("VCONFKEY_NETWORK_CLOSE");
        break;
    case VCONFKEY_NETWORK_ON:
        ZV_LOGI("VCONFKEY_NETWORK_ON");
        state = 1;
        break;
    default:
        ZV_LOGI("NETWORK_UNKNOWN");
        break;
    }
    if (g_callbacks.onoff)
        g_callbacks.onoff(state, userp);
}

static void _zv_ext_network_network_status_cb(keynode_t *node, void *userp)
{
    ZV_LOG_ENTER();
    if (!watcher_accepts(node, userp, VCONFKEY_NETWORK_STATUS))
        return;
    int type = ZV_NETWORK_TYPE_NONE;
    switch (vconf_keynode_get_int(node)) {
    case VCONFKEY_NETWORK_OFF:
        break;
    case VCONFKEY_NETWORK_CELLULAR:
        ZV_LOGI("NETWORK_CELLULAR");
        type = ZV_NETWORK_TYPE_CELLULAR;
        break;
    case VCONFKEY_NETWORK_WIFI:
        ZV_LOGI("NETWORK_WIFI");
        type = ZV_NETWORK_TYPE_WIFI;
        break;
    default:
        ZV_LOGI("NETWORK_UNKNOWN");
        break;
    }
    if (g_callbacks.status)
        g_callbacks.status(type, userp);
}

static void _zv_ext_network_config_change_cb(keynode_t *node, void *userp)
{
    ZV_LOG_ENTER();
    if (!watcher_accepts(node, userp, VCONFKEY_NETWORK_CONFIGURATION_CHANGE_IND))
        return;
    char *ip = vconf_get_str(VCONFKEY_NETWORK_IP);
    char *proxy = vconf_get_str(VCONFKEY_NETWORK_PROXY);
    if (g_callbacks.config) {
        g_callbacks.config(ip, proxy, userp);
        return;
    }
    free(ip);
    free(proxy);
}

static int _zv_ext_network_set_notify_network_onoff(void *userp)
{
    ZV_LOG_ENTER();
    int ret = vconf_notify_key_changed(VCONFKEY_NETWORK_CONFIGURATION_CHANGE_IND,
                                       _zv_ext_network_onoff_status_cb, userp);
    if (ret < 0) {
        ZV_LOGE("vconf_notify_key_changed is fail:%d", ret);
        return 0;
    }
    return 1;
}

static int _zv_ext_network_set_notify_network_status(void *userp)
{
    ZV_LOG_ENTER();
    int ret =
        vconf_notify_key_changed(VCONFKEY_NETWORK_STATUS, _zv_ext_network_network_status_cb, userp);
    if (ret < 0) {
        ZV_LOGE("vconf_notify_key_changed is fail:%d", ret);
        return 0;
    }
    return 1;
}

static int _zv_ext_network_set_notify_configuration_change(void *userp)
{
    ZV_LOG_ENTER();
    int ret = vconf_notify_key_changed(VCONFKEY_NETWORK_CONFIGURATION_CHANGE_IND,
                                       _zv_ext_network_config_change_cb, userp);
    if (ret < 0) {
        ZV_LOGE("vconf_notify_key_changed is fail:%d", ret);
        return 0;
    }
    return 1;
}

static int _zv_ext_network_check_network_status(void)
{
    int status = 0;
    if (vconf_get_int(VCONFKEY_NETWORK_STATUS, &status) != 0)
        return 0;
    switch (status) {
    case VCONFKEY_NETWORK_CELLULAR:
        ZV_LOGI("NETWORK_CELLULAR");
        return 1;
    case VCONFKEY_NETWORK_WIFI:
        ZV_LOGI("NETWORK_WIFI");
        return 1;
    case VCONFKEY_NETWORK_OFF:
        ZV_LOGI("NETWORK_OFF");
        return 0;
    default:
        ZV_LOGI("NETWORK_UNKNOWN");
        return 0;
    }
}

int zv_ext_network_register(void *userp, zv_ext_network_onoff_cb onoff_cb,
                            zv_ext_network_status_cb status_cb, zv_ext_network_config_cb config_cb)
{
    ZV_LOG_ENTER();
    if (!userp) {
        ZV_LOGE("userp is NULL");
        return 0;
    }
    // The host's network goes into the keys before they are watched: the first values are
    // read by the controller, not announced to it.
    if (net_monitor_wanted() && net_monitor_start() != 0)
        ZV_LOGE("host network monitor failed: the network keys are not kept");

    if (!_zv_ext_network_set_notify_network_onoff(userp) ||
        !_zv_ext_network_set_notify_network_status(userp) ||
        !_zv_ext_network_set_notify_configuration_change(userp))
        return 0;

    g_callbacks.onoff = onoff_cb;
    g_callbacks.status = status_cb;
    g_callbacks.config = config_cb;
    return 1;
}

int zv_ext_network_deregister(void)
{
    ZV_LOG_ENTER();
    g_callbacks = NetworkCallbacks{};
    net_monitor_stop();
    return 1;
}

int zv_ext_network_check(void)
{
    ZV_LOG_ENTER();
    return _zv_ext_network_check_network_status();
}

char *zv_ext_network_get_ip(void)
{
    ZV_LOG_ENTER();
    return vconf_get_str(VCONFKEY_NETWORK_IP);
}

char *zv_ext_network_get_proxy(void)
{
    ZV_LOG_ENTER();
    return vconf_get_str(VCONFKEY_NETWORK_PROXY);
}
