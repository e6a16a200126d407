#!/usr/bin/env bash
# Installs what is missing, builds the console, creates a simulated host in
# ./demo-host (kept between runs) and runs the console on it in this terminal.
set -euo pipefail
here="$(cd "$(dirname "$0")/.." && pwd)"
cd "$here"
bash scripts/install-deps.sh
bash scripts/build.sh build -DVELK_TESTS=OFF
host="$here/demo-host"
if [ ! -f "$host/host.json" ]; then
  build/tools/velk-simhost create "$host" --hostname host1.example.test
fi
echo "Simulated host: $host (change it with build/tools/velk-simhost set $host POINTER VALUE, then kill -USR1 the console)"
sleep 1
status=0
env VELK_HOST_ROOT="$host" build/apps/velk/velk || status=$?
echo "velk ended with status $status (on a host its supervisor starts it again; run this command again to restart it)"
