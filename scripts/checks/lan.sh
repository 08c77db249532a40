#!/usr/bin/env bash
# End-to-end check of the LAN gateway with a VISA client that knows nothing of the passport:
# starts rpcbind (when none runs; only the one started here is stopped again), starts
# lbpmx-lan of the native build against the built runtime, passport and simulated sensors
# (the two default sensors), checks that a second gateway refuses to start beside it, runs
# tests/lan_pyvisa.py and tests/tools/lan/lan_faults.py with Debian's pyvisa-py, then stops the
# gateway with SIGTERM and expects a clean exit that also leaves rpcbind. Every wait is bounded.
# LB_DEV_BUILD_DIR chooses another build folder.
set -uo pipefail
cd "$(dirname "$0")/../.."
dev=${LB_DEV_BUILD_DIR:-build/dev}
unset LBVISA_PASSPORTS PMXSIM_DEVICES
gateway="$PWD/$dev/bin/lbpmx-lan"
shim="$PWD/$dev/bin/lan_simcontrol.so"
for f in "$gateway" "$shim" "$PWD/$dev/bin/LbViPmx64.so"; do
  [ -f "$f" ] || { echo "missing $f"; exit 1; }
done
command -v rpcbind >/dev/null && command -v rpcinfo >/dev/null || { echo "rpcbind is not installed"; exit 1; }

work=$(mktemp -d)
rpcbind_pid=""; gateway_pid=""
cleanup() {
  [ -n "$gateway_pid" ] && kill -KILL "$gateway_pid" 2>/dev/null
  [ -n "$rpcbind_pid" ] && kill -TERM "$rpcbind_pid" 2>/dev/null && wait "$rpcbind_pid" 2>/dev/null
  rm -rf "$work"
}
trap cleanup EXIT
fail() { echo "FAILED: $*"; echo "--- gateway log:"; tail -n 40 "$work/gateway.log" 2>/dev/null; exit 1; }
# Polls a readiness condition for at most ~10 s (a process start, not a test's synchronisation).
wait_for() { for _ in $(seq 100); do eval "$1" && return 0; sleep 0.1; done; return 1; }

if ! timeout 5 rpcinfo -p 127.0.0.1 >/dev/null 2>&1; then
  rpcbind -f -w >"$work/rpcbind.log" 2>&1 &
  rpcbind_pid=$!
  wait_for 'timeout 2 rpcinfo -p 127.0.0.1 >/dev/null 2>&1' || fail "rpcbind did not start"
fi

# Free ports for the raw sockets (two for the Linux gateway, two for the Windows one): other
# builds may use 5025 on this machine.
base=$(/usr/bin/python3 -I -c '
import socket
for base in range(20000, 60000, 97):
    try:
        s = [socket.socket() for _ in range(4)]
        for i, x in enumerate(s): x.bind(("127.0.0.1", base + i))
        print(base); break
    except OSError: pass
    finally:
        for x in s: x.close()')

# Settings from a config file and flags, as a service would have them.
cat >"$work/lan.conf" <<CONF
# lbpmx-lan test settings
allow = 127.0.0.1/32
max-links = 2
idle-timeout = 60
CONF
mkfifo "$work/ctl" "$work/ack"
# Run against a sanitizer build (LB_DEV_BUILD_DIR=build/asan or build/tsan), two findings are the
# RPC library's own: small allocations its rpcbind client keeps, and the static scratch buffer
# every thread's XDR decoding writes the padding of opaque data into (never read).
echo "leak:libtirpc.so" >"$work/lsan.supp"
echo "race:libtirpc.so" >"$work/tsan.supp"
export LSAN_OPTIONS="suppressions=$work/lsan.supp${LSAN_OPTIONS:+:$LSAN_OPTIONS}"
export TSAN_OPTIONS="suppressions=$work/tsan.supp${TSAN_OPTIONS:+:$TSAN_OPTIONS}"
# The preloaded control library comes before the AddressSanitizer runtime (its own dependency).
export ASAN_OPTIONS="verify_asan_link_order=0${ASAN_OPTIONS:+:$ASAN_OPTIONS}"

listing=$(timeout 60 "$gateway" --list 2>/dev/null) || fail "--list failed"
echo "$listing" | grep -q '^inst0 100000 LBPMX::0x0003::100000::INSTR$' || fail "--list printed: $listing"
echo "$listing" | grep -q '^inst1 100001 ' || fail "--list printed: $listing"

# Started directly (no time-out wrapper), so that the trap's kill reaches the gateway itself.
LD_PRELOAD="$shim" LBPMX_LAN_SIMCTL="$work" "$gateway" --config "$work/lan.conf" \
  --max-links 6 --socket-port "$base" --log "$work/gateway.log" &
gateway_pid=$!
wait_for "grep -q 'serving' '$work/gateway.log' 2>/dev/null" || fail "the gateway did not start"

# A second gateway refuses to start while this one serves, and leaves its registration alone.
registration() { timeout 5 rpcinfo -p 127.0.0.1 2>/dev/null | grep ' 395183 '; }
registered=$(registration)
[ -n "$registered" ] || fail "not registered with rpcbind"
timeout 60 "$gateway" --socket-port "$((base + 2))" --log "$work/second.log"
rc=$?
[ "$rc" -eq 1 ] && grep -q "another VXI-11 server is registered with rpcbind on port .* and running; not starting" \
  "$work/second.log" || fail "a second gateway started beside a running one (exit $rc)"
[ "$(registration)" = "$registered" ] || fail "a second gateway changed the registration: $(registration)"

timeout 240 /usr/bin/python3 -I tests/lan_pyvisa.py "$base" "$work" || fail "pyvisa-py test"
timeout 240 /usr/bin/python3 -I tests/tools/lan/lan_faults.py "$base" "$work" || fail "pyvisa-py fault cases"
grep -q "socket inst1: 127.0.0.1 closed, the sensor's session is gone" "$work/gateway.log" \
  || fail "no log line for the closed socket of a replugged sensor"
grep -q "link [0-9]*: 127.0.0.1 closed inst0$" "$work/gateway.log" \
  && grep -q "link [0-9]*: 127.0.0.1 closed inst0, its connection ended$" "$work/gateway.log" \
  || fail "no log lines for closed VXI-11 links"

kill -TERM "$gateway_pid"
rc=0
wait_for "! kill -0 $gateway_pid 2>/dev/null" || fail "no exit after SIGTERM"
wait "$gateway_pid"; rc=$?; gateway_pid=""
[ "$rc" -eq 0 ] || fail "exit code $rc after SIGTERM"
grep -q "SIGTERM received, shutting down" "$work/gateway.log" && grep -q "stopped" "$work/gateway.log" \
  || fail "no clean shutdown in the log"
if timeout 5 rpcinfo -p 127.0.0.1 2>/dev/null | grep -q ' 395183 '; then fail "still registered with rpcbind"; fi
echo "  Linux gateway passed"

# The Windows build serves raw sockets only; under Wine its socket answers a native pyvisa-py
# and a Ctrl+C (SIGINT to the Wine process) stops it cleanly.
windows="$PWD/${LB_MINGW_BUILD_DIR:-build/mingw}/bin/lbpmx-lan.exe"
export WINEPREFIX="${WINEPREFIX:-$PWD/build/wineprefix}" WINEDEBUG=-all
if [ -f "$windows" ] && command -v wine >/dev/null && [ -d "$WINEPREFIX" ]; then
  : >"$work/windows.log"
  wine "$windows" --socket-port "$((base + 2))" --log "Z:${work//\//\\}\\windows.log" >"$work/windows.out" 2>&1 &
  gateway_pid=$!
  wait_for "grep -q 'serving' '$work/windows.log'" || { cat "$work/windows.out"; fail "the Windows gateway did not start"; }
  timeout 60 /usr/bin/python3 -I -c '
import sys, pyvisa
s = pyvisa.ResourceManager("@py").open_resource("TCPIP::127.0.0.1::%s::SOCKET" % sys.argv[1])
s.read_termination = "\n"
s.timeout = 10000
answer = s.query("*IDN?")
assert answer == "Marlowe&Tenby,PMX-M01,100000,1.20", answer
s.close()' "$((base + 2))" || fail "the Windows gateway did not answer: $(tail -n 5 "$work/windows.log")"
  kill -INT "$gateway_pid"
  wait_for "! kill -0 $gateway_pid 2>/dev/null" || fail "the Windows gateway did not stop"
  gateway_pid=""
  grep -q "stopped" "$work/windows.log" || fail "the Windows gateway stopped uncleanly: $(tail -n 5 "$work/windows.log")"
  echo "  Windows gateway (raw sockets, under Wine) passed"
else
  echo "  Windows gateway not checked (no mingw build or Wine prefix)"
fi
echo "LAN gateway check passed"
