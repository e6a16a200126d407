#!/usr/bin/env bash
# Builds the Debian packages velk and velk-simhost into ./dist (with the
# .buildinfo and .changes files), installing what the build needs first. The
# build runs in the source tree; what it leaves there is removed afterwards.
set -euo pipefail
here="$(cd "$(dirname "$0")/.." && pwd)"
cd "$here"

sudo_cmd=()
if [ "$(id -u)" -ne 0 ]; then sudo_cmd=(sudo); fi
apt_get() { "${sudo_cmd[@]}" env DEBIAN_FRONTEND=noninteractive apt-get "$@"; }

# The packaging tools, then the Build-Depends of debian/control.
tools=(dpkg-dev debhelper fakeroot lintian)
missing=()
for p in "${tools[@]}"; do
  dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q 'install ok installed' || missing+=("$p")
done
if [ ${#missing[@]} -gt 0 ]; then
  echo "Installing: ${missing[*]}"
  apt_get update -qq
  apt_get install -y -qq --no-install-recommends "${missing[@]}" >/dev/null
fi
if ! unmet="$(dpkg-checkbuilddeps 2>&1)"; then
  # "dpkg-checkbuilddeps: error: Unmet build dependencies: a b (>= 1)"
  wanted="$(sed -n 's/.*Unmet build dependencies: //p' <<<"$unmet" | sed 's/ ([^)]*)//g')"
  echo "Installing build dependencies: $wanted"
  apt_get update -qq
  # shellcheck disable=SC2086
  apt_get install -y -qq --no-install-recommends $wanted >/dev/null
fi

cleanup() { debian/rules clean >/dev/null 2>&1 || true; }
trap cleanup EXIT

# dpkg-buildpackage writes its results into the parent folder; collect those
# of this version from there.
version="$(dpkg-parsechangelog -S Version)"
arch="$(dpkg-architecture -qDEB_HOST_ARCH)"
dpkg-buildpackage -us -uc -b
mkdir -p dist
for f in "../velk_${version}_${arch}.deb" "../velk-simhost_${version}_${arch}.deb" \
         "../velk_${version}_${arch}.buildinfo" "../velk_${version}_${arch}.changes"; do
  mv -f "$f" dist/
done
# Debug symbols, when debhelper made packages of them.
for f in ../velk-dbgsym_"${version}"_"${arch}".deb ../velk-simhost-dbgsym_"${version}"_"${arch}".deb; do
  if [ -f "$f" ]; then mv -f "$f" dist/; fi
done
# The console's package holds what a Debian host needs.
tests/package/check-deb.sh "dist/velk_${version}_${arch}.deb"
echo "Packages in $here/dist:"
ls -1 dist
