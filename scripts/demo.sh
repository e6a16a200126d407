#!/usr/bin/env bash
# Installs what is missing, builds the console, creates a simulated host in
# ./demo-host (kept between runs) and runs the console on it in this terminal.
set -euo pipefail
here="$(cd "$(dirname "$0")/.." && pwd)"
cd "$here"
bash scripts/install-deps.sh
bash scripts/build.sh build -DVELK_TESTS=OFF
host="$here/demo-host"
if [ ! -f "$host/host.json" ] || [ ! -f "$host/etc/pam-wrapper/velk" ]; then
  build/tools/velk-simhost create "$host" --hostname host1.example.test --force
fi
echo "Simulated host: $host (change it with build/tools/velk-simhost set $host POINTER VALUE, then kill -USR1 the console)"
build/tools/velk-simhost login "$host"
sleep 2
# Logins go through a real PAM stack whose service files live in the host root
# (libpam-wrapper points libpam there); /etc/pam.d is not touched.
status=0
env PAM_WRAPPER=1 LD_PRELOAD=libpam_wrapper.so PAM_WRAPPER_SERVICE_DIR="$host/etc/pam-wrapper" \
  VELK_HOST_ROOT="$host" build/apps/velk/velk || status=$?
echo "velk ended with status $status (on a host its supervisor starts it again; run this command again to restart it)"
