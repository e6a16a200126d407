// The virtual machines of a Debian host: the running guests of libvirt's
// system instance, through virsh. A host without virsh runs none.
#pragma once

namespace VelkDebian {

// Guests with autostart set (the host's start-up and shut-down policy) are
// asked to shut down, and waited for up to velk.conf's "vm-shutdown-timeout";
// those still running then are left to powerOffVms. 0 unless the guests
// could not be listed.
int StopAutostartGuests();

}  // namespace VelkDebian
