#!/usr/bin/env bash
# Gateway load benchmark: wrk posts a one-row CT_SQL select to vemsd (the
# whole path: HTTP layer, SOAP parsing, logon check, SQL, XML rows, envelope)
# and the same load to kdh1_fixed_host, a service of the same HTTP layer that
# answers with a fixed 200-byte SOAP body. Prints the errors of the vemsd run
# (transport errors, non-2xx answers and answers without the row; goal 0),
# vemsd's resident-memory growth over the run after a warm-up (goal under 5%),
# and the requests/s of vemsd as a ratio of the reference's (goal at least 0.5).
#   bench/gateway-wrk.sh       (build dir: $CSIT_RELEASE_DIR, default build/release)
# Environment: WRK_CONNECTIONS (64), WRK_THREADS (2), WRK_SECONDS (60), WARMUP_SECONDS (30).
set -euo pipefail
cd "$(dirname "$0")/.."

BUILD=${CSIT_RELEASE_DIR:-build/release}
CONNS=${WRK_CONNECTIONS:-64}
THREADS=${WRK_THREADS:-2}
SECONDS_RUN=${WRK_SECONDS:-60}
WARMUP=${WARMUP_SECONDS:-30}

command -v wrk >/dev/null || scripts/install-deps
cmake -S . -B "$BUILD" -G Ninja -DCMAKE_BUILD_TYPE=Release -DCSIT_BENCH=ON \
  -DCMAKE_C_COMPILER=clang -DCMAKE_CXX_COMPILER=clang++ > /tmp/gateway-bench-cmake.log 2>&1 ||
  { cat /tmp/gateway-bench-cmake.log >&2; exit 1; }
cmake --build "$BUILD" --target vemsd createsit kdh1_fixed_host -j2 > /tmp/gateway-bench-build.log 2>&1 ||
  { tail -40 /tmp/gateway-bench-build.log >&2; exit 1; }

WORK=$(mktemp -d /tmp/gateway-bench-XXXXXX)
VEMSD_PID=""
FIXED_PID=""
cleanup() {
  [ -n "$VEMSD_PID" ] && kill -TERM "$VEMSD_PID" 2>/dev/null && wait "$VEMSD_PID" 2>/dev/null || true
  [ -n "$FIXED_PID" ] && kill -TERM "$FIXED_PID" 2>/dev/null && wait "$FIXED_PID" 2>/dev/null || true
  rm -rf "$WORK"
}
trap cleanup EXIT

PASSWORD=bench-Pass1
cat > "$WORK/body.xml" <<XML
<?xml version="1.0" encoding="UTF-8"?><SOAP-ENV:Envelope xmlns:SOAP-ENV="http://schemas.xmlsoap.org/soap/envelope/"><SOAP-ENV:Body><CT_SQL><userid>sysadmin</userid><password>$PASSWORD</password><table>O4SRV.TSITDESC</table><sql><![CDATA[SELECT SITNAME, REEV_TIME FROM O4SRV.TSITDESC WHERE SITNAME = "ZAG_CPU_Busy"]]></sql></CT_SQL></SOAP-ENV:Body></SOAP-ENV:Envelope>
XML
# The same script for both runs: every answer is looked at, and one that is
# not 2xx or lacks the expected text counts as an error.
cat > "$WORK/post.lua" <<'LUA'
local threads = {}
function setup(thread) table.insert(threads, thread) end
function init(args)
  needle = args[1]
  bad = 0
  local f = io.open(args[2], "rb")
  wrk.method = "POST"
  wrk.body = f:read("*a")
  f:close()
  wrk.headers["Content-Type"] = "text/xml; charset=utf-8"
end
function response(status, headers, body)
  if status < 200 or status > 299 or not string.find(body, needle, 1, true) then bad = bad + 1 end
end
function done(summary, latency, requests)
  local b = 0
  for _, t in ipairs(threads) do b = b + t:get("bad") end
  local e = summary.errors
  io.write(string.format("RESULT requests=%d seconds=%.2f rps=%.1f bad=%d sockerr=%d p99ms=%.2f\n",
    summary.requests, summary.duration / 1e6, summary.requests / (summary.duration / 1e6), b,
    e.connect + e.read + e.write + e.timeout, latency:percentile(99) / 1000))
end
LUA

wait_port() {  # file pattern
  for _ in $(seq 600); do
    local p
    p=$(grep -o "$2" "$1" 2>/dev/null | grep -o '[0-9]*$' | head -1) || true
    [ -n "$p" ] && { echo "$p"; return 0; }
    sleep 0.05
  done
  return 1
}
rss_kib() { awk '/^VmRSS:/{print $2}' "/proc/$1/status"; }
field() { sed -n "s/.*$2=\([0-9.]*\).*/\1/p" <<< "$1"; }
run_wrk() {  # url needle seconds
  wrk -t"$THREADS" -c"$CONNS" -d"${3}s" --latency -s "$WORK/post.lua" "$1" -- "$2" "$WORK/body.xml" | grep '^RESULT'
}

# vemsd with a store of its own; traces off the hot path (errors only, to a file).
RAS1_LOG="$WORK/vemsd-trace.log" "$BUILD/bin/vemsd" --home "$WORK/home" --port 0 \
  --admin-password "$PASSWORD" > "$WORK/vemsd.out" 2>&1 &
VEMSD_PID=$!
VEMSD_PORT=$(wait_port "$WORK/vemsd.out" 'listening on http://[0-9.]*:[0-9]*') ||
  { cat "$WORK/vemsd.out" >&2; exit 1; }
VEMSD_URL="http://127.0.0.1:$VEMSD_PORT/"
curl -sf -X POST --data-binary @"$WORK/body.xml" "$VEMSD_URL" | grep -q '<SITNAME>ZAG_CPU_Busy</SITNAME>' ||
  { echo "vemsd does not answer the select" >&2; exit 1; }

echo "warm-up: ${WARMUP}s on vemsd"
run_wrk "$VEMSD_URL" '<SITNAME>ZAG_CPU_Busy</SITNAME>' "$WARMUP" > /dev/null
RSS_BEFORE=$(rss_kib "$VEMSD_PID")
echo "vemsd: ${SECONDS_RUN}s, $CONNS connections"
GW=$(run_wrk "$VEMSD_URL" '<SITNAME>ZAG_CPU_Busy</SITNAME>' "$SECONDS_RUN")
RSS_AFTER=$(rss_kib "$VEMSD_PID")
echo "  $GW"
kill -TERM "$VEMSD_PID"; wait "$VEMSD_PID" || { echo "vemsd did not stop cleanly" >&2; exit 1; }
VEMSD_PID=""

"$BUILD/bin/kdh1_fixed_host" --port 0 > "$WORK/fixed.out" 2>&1 &
FIXED_PID=$!
FIXED_PORT=$(wait_port "$WORK/fixed.out" '^PORT [0-9]*') || { cat "$WORK/fixed.out" >&2; exit 1; }
FIXED_URL="http://127.0.0.1:$FIXED_PORT/"
run_wrk "$FIXED_URL" '</SOAP-ENV:Envelope>' "$WARMUP" > /dev/null
echo "kdh1 fixed 200-byte reply: ${SECONDS_RUN}s, $CONNS connections"
FX=$(run_wrk "$FIXED_URL" '</SOAP-ENV:Envelope>' "$SECONDS_RUN")
echo "  $FX"

ERRORS=$(( $(field "$GW" bad) + $(field "$GW" sockerr) ))
python3 - "$(field "$GW" rps)" "$(field "$FX" rps)" "$RSS_BEFORE" "$RSS_AFTER" "$ERRORS" <<'PY'
import sys
gw, fx, before, after, errors = float(sys.argv[1]), float(sys.argv[2]), int(sys.argv[3]), int(sys.argv[4]), int(sys.argv[5])
growth = (after - before) * 100.0 / before
ratio = gw / fx
ok = lambda good: "ok" if good else "MISSED"
print(f"errors of the vemsd run: {errors}  (goal 0: {ok(errors == 0)})")
print(f"vemsd resident memory after warm-up {before} KiB, after the run {after} KiB: growth {growth:.2f}%  (goal < 5%: {ok(growth < 5)})")
print(f"requests/s vemsd {gw:.0f} / fixed reply {fx:.0f} = {ratio:.3f}  (goal >= 0.5: {ok(ratio >= 0.5)})")
PY
