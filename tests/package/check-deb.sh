#!/usr/bin/env bash
# Checks a built velk .deb without installing it: the files a Debian host
# needs (the console, the host tools under /usr/libexec/velk and nothing in
# /bin or /sbin, the PAM service as a conffile, the manual page, the units)
# and the packages the tools run.
#   tests/package/check-deb.sh dist/velk_VERSION_ARCH.deb
set -euo pipefail
deb="$1"
listing="$(dpkg-deb -c "$deb")"
contents="$(awk '{print $6}' <<<"$listing" | sed 's|^\./|/|')"
depends="$(dpkg-deb -f "$deb" Depends)"
conffiles="$(dpkg-deb -I "$deb" conffiles 2>/dev/null || true)"
failed=0
fail() { echo "check-deb: $*" >&2; failed=1; }

for path in /usr/sbin/velk /etc/pam.d/velk /usr/share/man/man8/velk.8.gz \
            /lib/systemd/system/velk@.service /lib/systemd/system/velk-serial@.service \
            /usr/libexec/velk/velk-debian-tools /usr/libexec/velk/services.sh /usr/libexec/velk/SSH \
            /usr/libexec/velk/TarnShell; do
  grep -qx -- "$path" <<<"$contents" || fail "missing $path"
done
for tool in hrm-cmd tarncfg-advcfg tarncli localcli powerOffVms grabCIMData qelping firmwareConfig.sh \
            qelbacktrace; do
  grep -q -- " \./usr/libexec/velk/$tool -> velk-debian-tools$" <<<"$listing" ||
    fail "missing the link /usr/libexec/velk/$tool"
done
if grep -E '^/(usr/)?s?bin/.' <<<"$contents" | grep -vx /usr/sbin/velk; then
  fail "host tools placed in /bin or /sbin (above)"
fi
grep -qx /etc/pam.d/velk <<<"$conffiles" || fail "/etc/pam.d/velk is not a conffile"
for need in 'ifupdown | ifupdown2' iproute2 iputils-ping isc-dhcp-client; do
  grep -qF -- "$need" <<<"$depends" || fail "Depends lacks $need: $depends"
done
[ "$failed" -eq 0 ] && echo "check-deb: $deb is complete"
exit "$failed"
