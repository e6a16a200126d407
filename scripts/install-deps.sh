#!/usr/bin/env bash
# Installs the Debian 12 packages needed to build, run and test the console.
# Safe to run again: it only installs what is missing.
set -euo pipefail

packages=(
  build-essential cmake ninja-build pkg-config clang-format
  libncurses-dev libpam0g-dev libcrypt-dev
  libboost-regex-dev libboost-system-dev libboost-filesystem-dev
  nlohmann-json3-dev libgtest-dev googletest
  libvterm-dev libpam-wrapper libpam-modules
  openssl openssh-client less
  scdoc
  clang-14 libclang-rt-14-dev
  libnl-route-3-dev
  # The network namespace tests: ifupdown and its bridge hooks, a DHCP client,
  # the LAN's DHCP/RA/DNS server, and the tools the checks use.
  ifupdown isc-dhcp-client dnsmasq-base bridge-utils
  iputils-ping iputils-arping ndisc6 iproute2
)

missing=()
for p in "${packages[@]}"; do
  if ! dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q 'install ok installed'; then
    missing+=("$p")
  fi
done

if [ ${#missing[@]} -gt 0 ]; then
  sudo_cmd=()
  if [ "$(id -u)" -ne 0 ]; then sudo_cmd=(sudo); fi
  echo "Installing: ${missing[*]}"
  "${sudo_cmd[@]}" env DEBIAN_FRONTEND=noninteractive apt-get update -qq
  "${sudo_cmd[@]}" env DEBIAN_FRONTEND=noninteractive apt-get install -y -qq --no-install-recommends "${missing[@]}" >/dev/null
fi
