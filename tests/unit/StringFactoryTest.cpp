// The table of user-visible texts and the product heading built from the
// system-version record.
#include <gtest/gtest.h>

#include <cstring>
#include <string>

#include "StringFactory.hpp"
#include "en_US_Factory.hpp"
#include "hostctl/HostCtl.hpp"
#include "hostctl/QelCtl.hpp"

namespace {

using Velk::en_US_Factory;

void NoRecord(char*, size_t) { throw HostCtl::Lib::HostCtlException("no record"); }

// Spot checks across the table of texts no end-to-end test shows, odd
// spellings and mark-up included; 2 is the heading, 3 the blank.
TEST(StringFactory, Texts) {
    en_US_Factory factory(NoRecord);
    const std::pair<int, const char*> cases[] = {
        {3, ""},
        {21, "Operation on the management network interface failed."},
        {168, "Shut Down/Restart"},
        {174,
         "Host has VMs running. Are you sure you want to shutdown/restart the host or restore the network."},
        {192, "Restore to default blocked setting (unblocked) "},
        {201, "Select the kDS Uplinks (one or more) to be used by management qelnic"},
        {245,
         "{color:red}Warning! Restarting the management agents will disconnect all remote management "
         "software. This will affect all running services.\nCollection of extra troubleshooting "
         "information can take a noticeable amount of time.{/color}"},
        {251, "Please, wait ..."},
        {280, "Undoing the steps already done."},
        {305, ""},
        {1000, ""},
        {-1, ""},
    };
    for (const auto& [id, text] : cases) EXPECT_STREQ(factory.GetString(id), text) << "id " << id;
}

TEST(StringFactory, EveryIdButTheBlankHasText) {
    en_US_Factory factory(NoRecord);
    int nonEmpty = 0;
    for (int id = 0; id <= en_US_Factory::LAST_ID; ++id) {
        if (id == 2 || id == 3) continue;
        if (std::strlen(factory.GetString(id)) > 0) {
            ++nonEmpty;
        } else {
            ADD_FAILURE() << "empty text " << id;
        }
    }
    EXPECT_EQ(nonEmpty, 303);
}

TEST(StringFactory, TheOneFactoryServesEveryLocale) {
    Velk::StringFactory* factory = Velk::StringFactory::Get("en_US");
    ASSERT_NE(factory, nullptr);
    EXPECT_EQ(Velk::StringFactory::Get("en_US"), factory);
    EXPECT_EQ(Velk::StringFactory::Get("de_DE"), factory);
    EXPECT_STREQ(factory->GetString(4), "System Customization");
}

TEST(StringFactory, HeadingIsBuiltOnceFromTheRecord) {
    int reads = 0;
    en_US_Factory factory([&reads](char* record, size_t size) {
        ++reads;
        ASSERT_EQ(size, QelCtl::Util::SYSINFO_VERSION_SIZE);
        std::memset(record, 0, size);
        std::strcpy(record, "Tarni");
        std::strcpy(record + 32, "8.0.2");
        std::strcpy(record + 96, "8.0.2-1.34");
        std::strcpy(record + 128, "22380479");
        record[292] = 7;  // build number: not part of the heading
    });
    const char* first = factory.GetString(2);
    EXPECT_STREQ(first, "Tarni 8.0.2 (QELKernel 8.0.2-1.34 Build 22380479)");
    EXPECT_EQ(factory.GetString(2), first);
    EXPECT_EQ(reads, 1);
}

TEST(StringFactory, UnreadableRecordGivesEmptyHeadingForGood) {
    int reads = 0;
    en_US_Factory factory([&reads](char*, size_t) {
        ++reads;
        throw HostCtl::Lib::HostCtlException("sysinfo failed");
    });
    EXPECT_STREQ(factory.GetString(2), "");
    EXPECT_STREQ(factory.GetString(2), "");
    EXPECT_EQ(reads, 1);
}

TEST(StringFactory, HeadingFieldsStopAtTheirWidth) {
    char record[QelCtl::Util::SYSINFO_VERSION_SIZE];
    // No terminating zeros anywhere: each field is cut at the next one.
    std::memset(record, 'x', sizeof record);
    std::memset(record + 32, 'v', 64);
    std::memset(record + 96, 'r', 32);
    std::memset(record + 128, 'b', 164);
    const std::string heading = en_US_Factory::FormatHeading(record);
    EXPECT_EQ(heading, std::string(32, 'x') + " " + std::string(64, 'v') + " (QELKernel " +
                           std::string(32, 'r') + " Build " + std::string(164, 'b') + ")");
}

}  // namespace
