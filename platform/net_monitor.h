// Host network monitor: keeps the platform keys memory/dnet/status (2 with a network, else
// 0), memory/dnet/network_config (1 or 0), memory/dnet/ip (the address of the interface of
// the default route) and memory/dnet/proxy (from http_proxy, else empty) in line with the
// host. It reads the routes at start and again whenever the kernel reports a change of links,
// addresses or routes (rtnetlink, watched on the main loop), and writes a key only when its
// value changes, except network_config, which is rewritten whenever any of the four changed
// (the configuration-change indication). The status and network_config keys are written after
// ip and proxy, so their watchers read the new address.
// Thread safety: main loop only.
#pragma once

#ifdef __cplusplus
extern "C" {
#endif

// True when ZV_NETWORK asks for the host's network (unset or "host"); false for "keys".
int net_monitor_wanted(void);
// Brings the keys in line now and starts following changes. Starting twice is one start.
// Returns 0, or -1 when the keys could not be written (then nothing is followed); without
// rtnetlink the keys are written once and not followed (logged).
int net_monitor_start(void);
// Stops following changes; the keys keep their last values.
void net_monitor_stop(void);

#ifdef __cplusplus
}
#endif
