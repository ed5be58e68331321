#!/bin/sh
# The toolkit's desktop-file daemon for the test run. Its first client starts it when none runs,
# and a daemon started by a test keeps that test's output open for as long as it lives: ctest
# then waits for it to the test's time limit, though the test is over. Started here first, with
# its output on /dev/null, it is found running by every test.
#   toolkit-daemon.sh start PIDFILE   starts efreetd unless one runs; waits until it listens
#   toolkit-daemon.sh stop PIDFILE    ends the one this script started, by its pid
set -u
pidfile=$2
case "$1" in
start)
  rm -f "$pidfile"
  if pgrep -u "$(id -u)" -x efreetd >/dev/null 2>&1; then
    exit 0
  fi
  setsid /usr/bin/efreetd </dev/null >/dev/null 2>&1 &
  echo $! >"$pidfile"
  # Its socket, named .../efreetd/N, is listed once it listens (at most 10 s).
  i=0
  while [ $i -lt 100 ] && ! grep -q '/efreetd/' /proc/net/unix; do
    sleep 0.1
    i=$((i + 1))
  done
  ;;
stop)
  if [ -s "$pidfile" ]; then
    kill "$(cat "$pidfile")" 2>/dev/null
    rm -f "$pidfile"
  fi
  ;;
esac
exit 0
