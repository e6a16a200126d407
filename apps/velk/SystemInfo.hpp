// Helpers behind the host values shown on screen.
#pragma once

#include <cstdint>
#include <string>

namespace Velk {

// Memory size rounded up to 256 MiB, in the largest unit it reaches (MiB,
// GiB, TiB, PiB), with one truncated decimal when not whole: "6.2 G",
// "512 M". The caller appends the rest of the unit ("B", "iB Memory").
std::string FormatMemorySize(uint64_t bytes);

// "<version> build-<number>", the number padded to five digits.
std::string FormatVersion(const std::string& version, uint32_t build);

// Fingerprint of an SSH host key (a host path), or "" when it can't be made.
std::string GetSshKeyFingerprint(const std::string& keyFile);

// A property of a CIM class from the host's CIM data: "N/A" when the class
// has no instances, "" when the tool fails.
std::string GetCimProperty(const std::string& className, const std::string& propertyName);

// Total memory of the host in bytes.
uint64_t GetTotalMemoryBytes();

}  // namespace Velk
