// The HIDL runtime's behaviour that the library relies on: a failed call left
// unchecked stops the process, and death notices reach linked recipients once.
#include <gtest/gtest.h>

#include "tests/support/fake_hal.h"

using android::sp;
using android::wp;
using android::hardware::hidl_death_recipient;
using android::hardware::Return;
using android::hardware::Status;

namespace {

Status deadObject() { return Status::fromExceptionCode(Status::EX_TRANSACTION_FAILED); }

TEST(HidlReturnDeathTest, FailedCallsMustBeChecked) {
    EXPECT_DEATH({ Return<void> r = deadObject(); }, "status was never checked");
    EXPECT_DEATH({ bool b = Return<bool>(deadObject()); (void)b; }, "value of a failed HIDL call");
    Return<void> checked = deadObject();
    EXPECT_FALSE(checked.isOk());
    Return<void> moved = std::move(checked);  // the check travels with the status
    EXPECT_TRUE(moved.isDeadObject());
    EXPECT_FALSE(moved.isOk());
}

struct Recipient : hidl_death_recipient {
    std::vector<uint64_t> told;
    void serviceDied(uint64_t cookie, const wp<android::hidl::base::V1_0::IBase>&) override {
        told.push_back(cookie);
    }
};

TEST(HidlDeathNoticeTest, LinkedRecipientsAreToldOnceWithTheirCookie) {
    sp<FakeHal> hal = new FakeHal();
    sp<Recipient> linked = new Recipient(), unlinked = new Recipient();
    EXPECT_TRUE(hal->linkToDeath(linked, 7).withDefault(false));
    EXPECT_TRUE(hal->linkToDeath(unlinked, 8).withDefault(false));
    EXPECT_TRUE(hal->unlinkToDeath(unlinked).withDefault(false));
    EXPECT_FALSE(hal->linkToDeath(nullptr, 9).withDefault(true));
    hal->die();
    hal->die();
    EXPECT_EQ(linked->told, std::vector<uint64_t>{7});
    EXPECT_TRUE(unlinked->told.empty());
}

}  // namespace
