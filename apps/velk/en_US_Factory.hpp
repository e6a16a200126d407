// The English texts of the console.
#pragma once

#include <cstddef>
#include <functional>
#include <string>

#include "StringFactory.hpp"

namespace Velk {

class en_US_Factory : public StringFactory {
public:
    // Fills a system-version record of QelCtl::Util::SYSINFO_VERSION_SIZE
    // bytes; throws HostCtl::Lib::HostCtlException when it can't.
    using RecordReader = std::function<void(char* record, size_t size)>;

    // Reads the record through QelCtl::Util::SysinfoUtil::SysinfoGet.
    en_US_Factory();
    // Reads the record through `reader` (tests count and fail the reads).
    explicit en_US_Factory(RecordReader reader);

    // Texts 0 to 283; text 2, the product heading, is built from the
    // system-version record on first use and kept, empty when the record
    // can't be read (no retry). Text 3 is empty on purpose (blank menu rows).
    const char* GetString(int id) override;

    // "<product> <version> (QELKernel <release> Build <build>)" from a
    // system-version record.
    static std::string FormatHeading(const char* record);

    static constexpr int LAST_ID = 304;

private:
    const char* Heading();

    RecordReader _reader;
    bool _headingBuilt = false;
    std::string _heading;
};

}  // namespace Velk
