#!/usr/bin/env bash
# File-server benchmark: the gateway's file server over the HTTP service layer
# against nginx serving the same 64 KiB file (same wrk load, same machine),
# then the server's resident-memory growth while it sends a 1 GiB file.
#   bench/fileserver-wrk.sh                 (build dir: $CSIT_RELEASE_DIR, default build/release)
# Environment: WRK_CONNECTIONS (32), WRK_THREADS (2), WRK_SECONDS (5), WRK_ROUNDS (3);
# FILESERVER_HOST names an already built host program (no build then);
# FILESERVER_ARGS are extra host options (--threads N, --workers N).
# Goals: requests/s at least 0.7 of nginx's; memory growth below 32 MiB.
set -euo pipefail
cd "$(dirname "$0")/.."

BUILD=${CSIT_RELEASE_DIR:-build/release}
CONNS=${WRK_CONNECTIONS:-32}
THREADS=${WRK_THREADS:-2}
SECONDS_RUN=${WRK_SECONDS:-5}
ROUNDS=${WRK_ROUNDS:-3}

HOST_BIN=${FILESERVER_HOST:-$BUILD/bin/fileserver_host}
if [ -n "${FILESERVER_HOST:-}" ]; then
  :
elif [ ! -f "$BUILD/build.ninja" ]; then
  cmake -S . -B "$BUILD" -G Ninja -DCMAKE_BUILD_TYPE=Release -DCSIT_BENCH=ON -DCSIT_TESTS=OFF \
    -DCMAKE_C_COMPILER=clang -DCMAKE_CXX_COMPILER=clang++ > /tmp/fileserver-bench-cmake.log 2>&1 ||
    { cat /tmp/fileserver-bench-cmake.log >&2; exit 1; }
fi
if [ -z "${FILESERVER_HOST:-}" ]; then
  cmake --build "$BUILD" --target fileserver_host -j2 > /tmp/fileserver-bench-build.log 2>&1 ||
    { tail -40 /tmp/fileserver-bench-build.log >&2; exit 1; }
fi

WORK=$(mktemp -d /tmp/fileserver-bench-XXXXXX)
HOST_PID=""
NGINX_PID=""
cleanup() {
  [ -n "$HOST_PID" ] && kill -TERM "$HOST_PID" 2>/dev/null && wait "$HOST_PID" 2>/dev/null || true
  [ -n "$NGINX_PID" ] && kill -QUIT "$NGINX_PID" 2>/dev/null && wait "$NGINX_PID" 2>/dev/null || true
  rm -rf "$WORK"
}
trap cleanup EXIT

mkdir -p "$WORK/html" "$WORK/nginx"
head -c 65536 /dev/urandom > "$WORK/html/file64k.bin"
truncate -s 1G "$WORK/html/big.bin"   # sparse: costs no disk
chmod -R a+rX "$WORK"   # nginx workers started by root read as an unprivileged user

free_port() { python3 -c 'import socket; s=socket.socket(); s.bind(("127.0.0.1",0)); print(s.getsockname()[1]); s.close()'; }

# Our server.
"$HOST_BIN" --dir "$WORK/html" --port 0 ${FILESERVER_ARGS:-} > "$WORK/host.out" &
HOST_PID=$!
for _ in $(seq 200); do grep -q '^PORT ' "$WORK/host.out" 2>/dev/null && break; sleep 0.05; done
OUR_PORT=$(awk '/^PORT /{print $2}' "$WORK/host.out")
[ -n "$OUR_PORT" ] || { echo "fileserver_host did not start" >&2; exit 1; }

# nginx, in the foreground with its own configuration and temp folders.
NGINX_PORT=$(free_port)
cat > "$WORK/nginx/nginx.conf" <<CONF
worker_processes auto;
daemon off;
pid $WORK/nginx/nginx.pid;
error_log $WORK/nginx/error.log;
events { worker_connections 1024; }
http {
  access_log off;
  sendfile on;
  tcp_nopush on;
  keepalive_requests 100000;
  client_body_temp_path $WORK/nginx/body;
  proxy_temp_path $WORK/nginx/proxy;
  fastcgi_temp_path $WORK/nginx/fastcgi;
  uwsgi_temp_path $WORK/nginx/uwsgi;
  scgi_temp_path $WORK/nginx/scgi;
  types { application/octet-stream bin; }
  server { listen 127.0.0.1:$NGINX_PORT; root $WORK/html; location / { } }
}
CONF
nginx -p "$WORK/nginx" -e "$WORK/nginx/error.log" -c "$WORK/nginx/nginx.conf" &
NGINX_PID=$!
for _ in $(seq 100); do curl -sf -o /dev/null "http://127.0.0.1:$NGINX_PORT/file64k.bin" && break; sleep 0.05; done

check() { # url
  local n
  n=$(curl -sf -o /dev/null -w '%{size_download}' "$1")
  [ "$n" = "65536" ] || { echo "bad answer from $1 ($n bytes)" >&2; exit 1; }
}
check "http://127.0.0.1:$OUR_PORT/soap/file64k.bin"
check "http://127.0.0.1:$NGINX_PORT/file64k.bin"

# CPU ticks (user + system) used so far by the given processes.
ticks() { local t=0 p; for p in "$@"; do t=$((t + $(awk '{print $14 + $15}' "/proc/$p/stat"))); done; echo "$t"; }
HZ=$(getconf CLK_TCK)
# One wrk run: prints "requests/s requests cpu-ticks" for the server processes given after the url.
run() { # url pids...
  local url=$1; shift
  local t0 out t1
  t0=$(ticks "$@")
  out=$(wrk -t"$THREADS" -c"$CONNS" -d"${SECONDS_RUN}s" "$url")
  t1=$(ticks "$@")
  echo "$(echo "$out" | awk '/^Requests\/sec:/{print $2}') $(echo "$out" | awk '/requests in/{print $1}') $((t1 - t0))"
}
NGINX_PIDS="$NGINX_PID $(pgrep -P "$NGINX_PID" | tr '\n' ' ')"
# Rounds alternate between the two servers and the best rate of each counts,
# so that load from other processes on the machine hits both alike; the CPU
# time the servers spend per request is summed over all rounds (it depends
# much less on that load).
OURS=0; THEIRS=0; ALL_OURS=""; ALL_THEIRS=""; RQ_A=0; RQ_B=0; CPU_A=0; CPU_B=0
for _ in $(seq "$ROUNDS"); do
  read -r A NA TA < <(run "http://127.0.0.1:$OUR_PORT/soap/file64k.bin" "$HOST_PID")
  # shellcheck disable=SC2086
  read -r B NB TB < <(run "http://127.0.0.1:$NGINX_PORT/file64k.bin" $NGINX_PIDS)
  ALL_OURS="$ALL_OURS $A"; ALL_THEIRS="$ALL_THEIRS $B"
  RQ_A=$((RQ_A + NA)); RQ_B=$((RQ_B + NB)); CPU_A=$((CPU_A + TA)); CPU_B=$((CPU_B + TB))
  OURS=$(awk -v a="$A" -v b="$OURS" 'BEGIN{print (a>b)?a:b}')
  THEIRS=$(awk -v a="$B" -v b="$THEIRS" 'BEGIN{print (a>b)?a:b}')
done
RATIO=$(awk -v a="$OURS" -v b="$THEIRS" 'BEGIN{printf "%.2f", a/b}')
US_A=$(awk -v t="$CPU_A" -v n="$RQ_A" -v hz="$HZ" 'BEGIN{printf "%.0f", t * 1e6 / hz / n}')
US_B=$(awk -v t="$CPU_B" -v n="$RQ_B" -v hz="$HZ" 'BEGIN{printf "%.0f", t * 1e6 / hz / n}')
echo "64 KiB file, wrk -t$THREADS -c$CONNS -d${SECONDS_RUN}s, best of $ROUNDS alternating rounds (load: $(cut -d' ' -f1 /proc/loadavg))"
echo "  file server over kdh1: $OURS requests/s  (rounds:$ALL_OURS), server CPU $US_A us/request"
echo "  nginx:                 $THEIRS requests/s  (rounds:$ALL_THEIRS), server CPU $US_B us/request"
echo "  ratio:                 $RATIO (goal >= 0.70); CPU-time ratio $(awk -v a="$US_A" -v b="$US_B" 'BEGIN{printf "%.2f", b/a}')"

# 1 GiB: sample the server's resident set while one client downloads it.
rss_kib() { awk '/^VmRSS:/{print $2}' "/proc/$HOST_PID/status"; }
BEFORE=$(rss_kib)
PEAK=$BEFORE
curl -sf -o /dev/null -w '%{size_download}\n' "http://127.0.0.1:$OUR_PORT/soap/big.bin" > "$WORK/big.size" &
CURL_PID=$!
while kill -0 "$CURL_PID" 2>/dev/null; do
  NOW=$(rss_kib)
  [ "$NOW" -gt "$PEAK" ] && PEAK=$NOW
  sleep 0.05
done
wait "$CURL_PID"
SENT=$(cat "$WORK/big.size")
[ "$SENT" = "1073741824" ] || { echo "1 GiB download incomplete: $SENT bytes" >&2; exit 1; }
GROWTH=$(awk -v a="$PEAK" -v b="$BEFORE" 'BEGIN{printf "%.1f", (a-b)/1024}')
echo "1 GiB file: $SENT bytes sent, resident memory $((BEFORE/1024)) MiB before, growth $GROWTH MiB (goal < 32)"
