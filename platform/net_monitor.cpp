// Host network monitor: the memory/dnet/ keys follow the host's default route, read from
// /proc/net/route and /proc/net/ipv6_route, re-read whenever rtnetlink reports a change of
// links, addresses or routes (the socket is watched on the Ecore main loop, and a burst of
// messages is read once after a short quiet time).
#include "net_monitor.h"

#include <Ecore.h>
#include <arpa/inet.h>
#include <errno.h>
#include <ifaddrs.h>
#include <linux/netlink.h>
#include <linux/rtnetlink.h>
#include <net/if.h>
#include <net/route.h>
#include <netinet/in.h>
#include <stdlib.h>
#include <string.h>
#include <sys/socket.h>
#include <unistd.h>
#include <vconf.h>

#include <fstream>
#include <sstream>
#include <string>

#include "zv-log.h"

namespace
{

const double kSettleSeconds = 0.2;

struct HostNetwork {
    bool connected = false;
    std::string ip;
};

struct MonitorState {
    bool started = false;
    int fd = -1;
    Ecore_Fd_Handler *handler = nullptr;
    Ecore_Timer *settle = nullptr;
};

MonitorState g_monitor;

struct Route {
    std::string iface;
    unsigned long metric = 0;
    bool found = false;
};

// The IPv4 default route with the lowest metric.
Route default_route_v4()
{
    Route best;
    std::ifstream in("/proc/net/route");
    std::string line;
    std::getline(in, line); // header
    while (std::getline(in, line)) {
        std::istringstream fields(line);
        std::string iface, dest, gateway, flags_hex, refcnt, use, metric, mask;
        if (!(fields >> iface >> dest >> gateway >> flags_hex >> refcnt >> use >> metric >> mask))
            continue;
        unsigned long flags = strtoul(flags_hex.c_str(), nullptr, 16);
        if (dest != "00000000" || mask != "00000000" || !(flags & RTF_UP) || (flags & RTF_REJECT))
            continue;
        unsigned long m = strtoul(metric.c_str(), nullptr, 10);
        if (!best.found || m < best.metric)
            best = Route{iface, m, true};
    }
    return best;
}

// The IPv6 default route with the lowest metric, leaving out the loopback's reject routes.
Route default_route_v6()
{
    Route best;
    std::ifstream in("/proc/net/ipv6_route");
    std::string line;
    while (std::getline(in, line)) {
        std::istringstream fields(line);
        std::string dest, dest_len, src, src_len, next_hop, metric, refcnt, use, flags_hex, iface;
        if (!(fields >> dest >> dest_len >> src >> src_len >> next_hop >> metric >> refcnt >> use >>
              flags_hex >> iface))
            continue;
        unsigned long flags = strtoul(flags_hex.c_str(), nullptr, 16);
        if (dest != std::string(32, '0') || dest_len != "00" || iface == "lo" ||
            !(flags & RTF_UP) || (flags & RTF_REJECT))
            continue;
        unsigned long m = strtoul(metric.c_str(), nullptr, 16);
        if (!best.found || m < best.metric)
            best = Route{iface, m, true};
    }
    return best;
}

// The first address of family on iface (IPv6: not link-local), as text; empty when none.
std::string interface_address(const std::string &iface, int family)
{
    struct ifaddrs *list = nullptr;
    if (getifaddrs(&list) != 0)
        return {};
    std::string result;
    for (struct ifaddrs *a = list; a && result.empty(); a = a->ifa_next) {
        if (!a->ifa_addr || a->ifa_addr->sa_family != family || iface != a->ifa_name)
            continue;
        char text[INET6_ADDRSTRLEN] = "";
        if (family == AF_INET) {
            auto *sin = reinterpret_cast<struct sockaddr_in *>(a->ifa_addr);
            inet_ntop(AF_INET, &sin->sin_addr, text, sizeof text);
        } else {
            auto *sin6 = reinterpret_cast<struct sockaddr_in6 *>(a->ifa_addr);
            if (IN6_IS_ADDR_LINKLOCAL(&sin6->sin6_addr))
                continue;
            inet_ntop(AF_INET6, &sin6->sin6_addr, text, sizeof text);
        }
        result = text;
    }
    freeifaddrs(list);
    return result;
}

HostNetwork read_host_network()
{
    HostNetwork net;
    Route v4 = default_route_v4();
    if (v4.found) {
        net.connected = true;
        net.ip = interface_address(v4.iface, AF_INET);
        return net;
    }
    Route v6 = default_route_v6();
    if (v6.found) {
        net.connected = true;
        net.ip = interface_address(v6.iface, AF_INET6);
    }
    return net;
}

bool string_key_differs(const char *key, const std::string &value)
{
    char *current = vconf_get_str(key);
    bool differs = !current || value != current;
    free(current);
    return differs;
}

bool int_key_differs(const char *key, int value)
{
    int current = 0;
    return vconf_get_int(key, &current) != VCONF_OK || current != value;
}

// Writes the keys whose values differ from the host's. The address and proxy go first, so
// that the watchers of the status and network_config keys read the new ones; network_config
// is rewritten whenever anything changed, as the platform's configuration-change indication.
bool sync_keys()
{
    HostNetwork net = read_host_network();
    const char *proxy_env = getenv("http_proxy");
    std::string proxy = proxy_env ? proxy_env : "";
    int status = net.connected ? VCONFKEY_NETWORK_WIFI : VCONFKEY_NETWORK_OFF;
    int config = net.connected ? VCONFKEY_NETWORK_ON : VCONFKEY_NETWORK_CLOSE;

    bool ok = true;
    bool changed = false;
    if (string_key_differs(VCONFKEY_NETWORK_IP, net.ip)) {
        ok &= vconf_set_str(VCONFKEY_NETWORK_IP, net.ip.c_str()) == VCONF_OK;
        changed = true;
    }
    if (string_key_differs(VCONFKEY_NETWORK_PROXY, proxy)) {
        ok &= vconf_set_str(VCONFKEY_NETWORK_PROXY, proxy.c_str()) == VCONF_OK;
        changed = true;
    }
    if (int_key_differs(VCONFKEY_NETWORK_STATUS, status)) {
        ok &= vconf_set_int(VCONFKEY_NETWORK_STATUS, status) == VCONF_OK;
        changed = true;
    }
    if (changed || int_key_differs(VCONFKEY_NETWORK_CONFIGURATION_CHANGE_IND, config))
        ok &= vconf_set_int(VCONFKEY_NETWORK_CONFIGURATION_CHANGE_IND, config) == VCONF_OK;
    if (!ok)
        ZV_LOGE("network keys could not be written");
    else if (changed)
        ZV_LOGI("host network: %s, ip \"%s\", proxy \"%s\"", net.connected ? "connected" : "none",
                net.ip.c_str(), proxy.c_str());
    return ok;
}

Eina_Bool on_settled(void *)
{
    g_monitor.settle = nullptr;
    sync_keys();
    return ECORE_CALLBACK_CANCEL;
}

Eina_Bool on_netlink(void *, Ecore_Fd_Handler *)
{
    char buf[8192];
    for (;;) {
        ssize_t n = recv(g_monitor.fd, buf, sizeof buf, 0);
        if (n > 0)
            continue;
        if (n < 0 && errno == EINTR)
            continue;
        // EAGAIN ends the burst; ENOBUFS lost some messages, which a fresh read makes up for.
        break;
    }
    if (!g_monitor.settle)
        g_monitor.settle = ecore_timer_add(kSettleSeconds, on_settled, nullptr);
    return ECORE_CALLBACK_RENEW;
}

int open_netlink()
{
    int fd = socket(AF_NETLINK, SOCK_RAW | SOCK_NONBLOCK | SOCK_CLOEXEC, NETLINK_ROUTE);
    if (fd < 0)
        return -1;
    struct sockaddr_nl addr;
    memset(&addr, 0, sizeof addr);
    addr.nl_family = AF_NETLINK;
    addr.nl_groups = RTMGRP_LINK | RTMGRP_IPV4_IFADDR | RTMGRP_IPV4_ROUTE | RTMGRP_IPV6_IFADDR |
                     RTMGRP_IPV6_ROUTE;
    if (bind(fd, reinterpret_cast<struct sockaddr *>(&addr), sizeof addr) != 0) {
        close(fd);
        return -1;
    }
    return fd;
}

} // namespace

int net_monitor_wanted(void)
{
    const char *mode = getenv("ZV_NETWORK");
    return !mode || !*mode || strcmp(mode, "host") == 0;
}

int net_monitor_start(void)
{
    if (g_monitor.started)
        return 0;
    if (!sync_keys())
        return -1;
    g_monitor.started = true;
    g_monitor.fd = open_netlink();
    if (g_monitor.fd < 0) {
        ZV_LOGW("rtnetlink: %s: network changes are not followed", strerror(errno));
        return 0;
    }
    g_monitor.handler = ecore_main_fd_handler_add(g_monitor.fd, ECORE_FD_READ, on_netlink, nullptr,
                                                  nullptr, nullptr);
    if (!g_monitor.handler) {
        ZV_LOGW("rtnetlink watch failed: network changes are not followed");
        close(g_monitor.fd);
        g_monitor.fd = -1;
    }
    return 0;
}

void net_monitor_stop(void)
{
    if (!g_monitor.started)
        return;
    if (g_monitor.settle)
        ecore_timer_del(g_monitor.settle);
    if (g_monitor.handler)
        ecore_main_fd_handler_del(g_monitor.handler);
    if (g_monitor.fd >= 0)
        close(g_monitor.fd);
    g_monitor = MonitorState{};
}
