// The NDK binder as the library relies on it: services found by name, calls that reach the service and
// bring back its status, death told once, objects alive while anything holds them. Built twice:
// BINDER_TEST_API 31 with binder_host_api31 in the process, 29 without it.
#include <dlfcn.h>

#include <atomic>
#include <chrono>
#include <functional>
#include <future>

#include <aidl/android/hardware/bluetooth/BnBluetoothHci.h>
#include <aidl/android/hardware/bluetooth/BnBluetoothHciCallbacks.h>
#include <android/binder_host.h>
#include <android/binder_manager.h>
#include <gtest/gtest.h>

namespace {

using namespace aidl::android::hardware::bluetooth;
using ndk::ScopedAStatus;
using ndk::SpAIBinder;
using Bytes = std::vector<uint8_t>;

static_assert(!std::is_copy_constructible_v<ScopedAStatus>, "a status has one owner");
const std::string kName = std::string(IBluetoothHci::descriptor) + "/default";
const char* const kInstance = kName.c_str();
const Bytes kReset = {0x03, 0x0c, 0x00};
ScopedAStatus ok() { return ScopedAStatus::ok(); }

struct FakeHci : BnBluetoothHci {
    explicit FakeHci(bool* destroyed = nullptr) : destroyed(destroyed) {}
    ~FakeHci() override { if (destroyed != nullptr) *destroyed = true; }
    ScopedAStatus initialize(const std::shared_ptr<IBluetoothHciCallbacks>& cb) override {
        callback = cb;
        return cb->initializationComplete(Status::SUCCESS);
    }
    ScopedAStatus sendHciCommand(const Bytes& command) override { commands.push_back(command); return answer(); }
    ScopedAStatus close() override { return ok(); }
    ScopedAStatus sendAclData(const Bytes&) override { return ok(); }
    ScopedAStatus sendIsoData(const Bytes&) override { return ok(); }
    ScopedAStatus sendScoData(const Bytes&) override { return ok(); }
    bool* destroyed;
    ScopedAStatus (*answer)() = ok;
    std::vector<Bytes> commands;
    std::shared_ptr<IBluetoothHciCallbacks> callback;
};

struct FakeCallbacks : BnBluetoothHciCallbacks {
    ScopedAStatus initializationComplete(Status status) override { completed.push_back(status); return ok(); }
    ScopedAStatus aclDataReceived(const Bytes&) override { return ok(); }
    ScopedAStatus hciEventReceived(const Bytes&) override { return ok(); }
    ScopedAStatus isoDataReceived(const Bytes&) override { return ok(); }
    ScopedAStatus scoDataReceived(const Bytes&) override { return ok(); }
    std::vector<Status> completed;
};

void toldOfDeath(void* cookie) { ++*static_cast<std::atomic<int>*>(cookie); }

template <typename F>
F* resolve(const char* name) { return reinterpret_cast<F*>(dlsym(RTLD_DEFAULT, name)); }
SpAIBinder getService() { return SpAIBinder(AServiceManager_getService(kInstance)); }

class BinderTest : public ::testing::Test {
  protected:
    void TearDown() override { ndk::host::removeService(kInstance); ndk::host::setDeclared(kInstance, false); }
    void registerHal() { ASSERT_EQ(AServiceManager_addService(hal->asBinder().get(), kInstance), EX_NONE); }
    std::shared_ptr<FakeHci> hal = ndk::SharedRefBase::make<FakeHci>();
};

// The library looks the API 31 calls up at run time and goes on without them on an older device.
TEST(BinderApiLevelTest, Api31CallsResolveOnlyWhereTheDeviceHasThem) {
    const struct { const char* name; bool present; } cases[] = {
            {"AServiceManager_checkService", true}, {"AServiceManager_getService", true},
            {"AServiceManager_waitForService", BINDER_TEST_API >= 31},
            {"AServiceManager_isDeclared", BINDER_TEST_API >= 31}};
    for (const auto& c : cases) EXPECT_EQ(resolve<void>(c.name) != nullptr, c.present) << c.name;
}

TEST_F(BinderTest, ServiceIsFoundFromRegistrationToRemoval) {
    EXPECT_EQ(SpAIBinder(AServiceManager_checkService(kInstance)).get(), nullptr);
    EXPECT_EQ(getService().get(), nullptr);
    registerHal();
    EXPECT_EQ(SpAIBinder(AServiceManager_checkService(kInstance)), hal->asBinder());
    EXPECT_EQ(getService(), hal->asBinder());
    EXPECT_TRUE(ndk::host::removeService(kInstance));
    EXPECT_FALSE(ndk::host::removeService(kInstance));
    EXPECT_EQ(getService().get(), nullptr);
    EXPECT_EQ(IBluetoothHciCallbacks::fromBinder(hal->asBinder()), nullptr);  // not of that interface
}

TEST_F(BinderTest, DeclaredNameIsWaitedForUntilRegistered) {
    if (BINDER_TEST_API < 31) GTEST_SKIP() << "no API 31 calls on this device";
    auto isDeclared = resolve<bool(const char*)>("AServiceManager_isDeclared");
    auto waitFor = resolve<AIBinder*(const char*)>("AServiceManager_waitForService");
    ASSERT_TRUE(isDeclared != nullptr && waitFor != nullptr);
    EXPECT_FALSE(isDeclared(kInstance));
    EXPECT_EQ(waitFor(kInstance), nullptr);  // neither declared nor registered: no wait
    ndk::host::setDeclared(kInstance, true);
    EXPECT_TRUE(isDeclared(kInstance));
    auto waited = std::async(std::launch::async, [&] { return SpAIBinder(waitFor(kInstance)); });
    EXPECT_EQ(waited.wait_for(std::chrono::milliseconds(50)), std::future_status::timeout);
    registerHal();
    bool ready = waited.wait_for(std::chrono::seconds(10)) == std::future_status::ready;
    if (!ready) ndk::host::setDeclared(kInstance, false);  // ends a wait that missed the registration
    ASSERT_TRUE(ready);
    EXPECT_EQ(waited.get(), hal->asBinder());
}

TEST_F(BinderTest, CallReachesTheServiceAndBringsBackItsStatus) {
    using S = ScopedAStatus;
    const struct { S (*answer)(); binder_exception_t exception; binder_status_t status; int32_t specific; } cases[] = {
            {ok, EX_NONE, STATUS_OK, 0},
            {[] { return S::fromServiceSpecificError(5); }, EX_SERVICE_SPECIFIC, STATUS_OK, 5},
            {[] { return S::fromExceptionCode(EX_ILLEGAL_STATE); }, EX_ILLEGAL_STATE, STATUS_OK, 0},
            {[] { return S::fromExceptionCode(EX_TRANSACTION_FAILED); }, EX_TRANSACTION_FAILED,
             STATUS_FAILED_TRANSACTION, 0},
            {[] { return S::fromStatus(STATUS_BAD_VALUE); }, EX_TRANSACTION_FAILED, STATUS_BAD_VALUE, 0},
            {[] { return S::fromStatus(12345); }, EX_TRANSACTION_FAILED, STATUS_UNKNOWN_ERROR, 0}};  // pruned
    registerHal();
    std::shared_ptr<IBluetoothHci> hci = IBluetoothHci::fromBinder(getService());
    ASSERT_NE(hci, nullptr);
    for (const auto& c : cases) {
        hal->answer = c.answer;
        ScopedAStatus status = hci->sendHciCommand(kReset);
        const std::string seen = status.getDescription();
        EXPECT_EQ(status.isOk(), c.exception == EX_NONE) << seen;
        EXPECT_EQ(status.getExceptionCode(), c.exception) << seen;
        EXPECT_EQ(status.getStatus(), c.status) << seen;
        EXPECT_EQ(status.getServiceSpecificError(), c.specific) << seen;
    }
    EXPECT_EQ(hal->commands, std::vector<Bytes>(std::size(cases), kReset));
    int32_t version = 0;
    EXPECT_TRUE(hci->getInterfaceVersion(&version).isOk());
    EXPECT_EQ(version, 1);
    auto callbacks = ndk::SharedRefBase::make<FakeCallbacks>();  // the service calls back through a proxy
    EXPECT_TRUE(hci->initialize(callbacks).isOk());
    EXPECT_EQ(hci->initialize(nullptr).getStatus(), STATUS_UNEXPECTED_NULL);
    EXPECT_EQ(callbacks->completed, std::vector<Status>{Status::SUCCESS});
    EXPECT_TRUE(hal->callback != nullptr && hal->callback->isRemote());
}

TEST_F(BinderTest, DeathIsToldOnceToEachLinkAndLaterCallsFailAsDeadObject) {
    registerHal();
    std::shared_ptr<IBluetoothHci> hci = IBluetoothHci::fromBinder(getService());
    ASSERT_NE(hci, nullptr);
    AIBinder* binder = hci->asBinder().get();  // held by hci
    ndk::ScopedAIBinder_DeathRecipient recipient(AIBinder_DeathRecipient_new(toldOfDeath));
    std::atomic<int> linked{0}, unlinked{0};
    ASSERT_EQ(AIBinder_linkToDeath(binder, recipient.get(), &linked), STATUS_OK);
    ASSERT_EQ(AIBinder_linkToDeath(binder, recipient.get(), &unlinked), STATUS_OK);
    EXPECT_EQ(AIBinder_unlinkToDeath(binder, recipient.get(), &unlinked), STATUS_OK);
    EXPECT_EQ(AIBinder_unlinkToDeath(binder, recipient.get(), &unlinked), STATUS_NAME_NOT_FOUND);
    auto caller = std::async(std::launch::async, [&] {  // calls racing the death reach the service or fail dead
        for (int n = 0; n < 200; ++n) {
            ScopedAStatus status = hci->sendHciCommand(kReset);
            EXPECT_TRUE(status.isOk() || status.getStatus() == STATUS_DEAD_OBJECT) << status.getDescription();
        }
    });
    // Recipients are told on the killing thread, before killService returns.
    auto killer = std::async(std::launch::async, [&] {
        ndk::host::killService(binder);
        ndk::host::killService(binder);
    });
    ASSERT_EQ(killer.wait_for(std::chrono::seconds(10)), std::future_status::ready);
    caller.get();
    EXPECT_EQ(linked, 1);
    EXPECT_EQ(unlinked, 0);
    EXPECT_EQ(AIBinder_ping(binder), STATUS_DEAD_OBJECT);
    EXPECT_EQ(AIBinder_linkToDeath(binder, recipient.get(), &linked), STATUS_DEAD_OBJECT);
    const size_t reached = hal->commands.size();
    ScopedAStatus late = hci->sendHciCommand(kReset);
    EXPECT_EQ(late.getExceptionCode(), EX_TRANSACTION_FAILED);
    EXPECT_EQ(late.getStatus(), STATUS_DEAD_OBJECT);
    EXPECT_EQ(hal->commands.size(), reached);
    EXPECT_EQ(getService().get(), nullptr);  // its registration went with its process
}

TEST_F(BinderTest, ObjectLivesUntilTheLastPointerAndTheLastBinderReferenceGo) {
    for (const auto& order : std::vector<std::vector<int>>{{0, 1, 2, 3, 4}, {4, 3, 2, 1, 0}, {1, 3, 0, 4, 2}}) {
        bool destroyed = false;
        std::shared_ptr<FakeHci> object = ndk::SharedRefBase::make<FakeHci>(&destroyed);
        SpAIBinder binder = object->asBinder();
        EXPECT_EQ(object->asBinder(), binder);  // one binder while it is held
        std::shared_ptr<IBluetoothHci> proxy = IBluetoothHci::fromBinder(binder);
        AIBinder* raw = binder.get();
        AIBinder_incStrong(raw);
        ASSERT_EQ(AServiceManager_addService(raw, kInstance), EX_NONE);
        std::function<void()> release[] = {[&] { object.reset(); }, [&] { binder = SpAIBinder(); },
                                           [&] { proxy.reset(); }, [&] { AIBinder_decStrong(raw); },
                                           [&] { ndk::host::removeService(kInstance); }};
        for (int holder : order) {
            EXPECT_FALSE(destroyed) << "before holder " << holder << " let go";
            release[holder]();
        }
        EXPECT_TRUE(destroyed);
    }
}

}  // namespace
