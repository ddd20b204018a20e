// HAL client session against scripted HALs, every row over HIDL and AIDL:
// opening and its failures, the callbacks' bytes on the tool end, the pump's
// packets at the HAL, death, closing and reopening; and which HAL is chosen.
// Built twice: SESSION_TEST_API 31, and 29 for a device whose service manager
// cannot say whether the AIDL HAL is declared.
#include "transport/session.h"

#include <sys/socket.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <map>
#include <string>
#include <thread>
#include <vector>

#include <android/binder_host.h>
#include <gtest/gtest.h>

#include "tests/support/fake_hal.h"
#include "tests/support/log_capture.h"
#include "tests/support/process.h"

using android::sp;
using Bytes = std::vector<uint8_t>;
using InitMode = HalScript::InitMode;
using HidlStatus = FakeHal::Status;
using AidlStatus = FakeAidlHal::Status;

namespace {

const int INFO = ANDROID_LOG_INFO;
const int ERROR = ANDROID_LOG_ERROR;
const std::string kAidlName = "android.hardware.bluetooth.IBluetoothHci/default";

std::shared_ptr<HalScript> installHidl(InitMode mode, int status) {
    sp<FakeHal> hal = new FakeHal(mode, static_cast<HidlStatus>(status));
    hal->registerDefault();
    return std::shared_ptr<HalScript>(hal.get(), [hal](HalScript*) {});
}

std::shared_ptr<HalScript> installAidl(InitMode mode, int status) {
    std::shared_ptr<FakeAidlHal> hal = ndk::SharedRefBase::make<FakeAidlHal>(mode, static_cast<AidlStatus>(status));
    hal->registerDefault();
    return hal;
}

struct Hal {
    const char* name;
    std::shared_ptr<HalScript> (*install)(InitMode mode, int status);
    int failure;              // an initialisation that failed
    const char* opened[2];    // a successful opening's lines
    const char* other;        // a line of the other HAL's path, never logged
    const char* failed[2];    // a failed opening's lines
    const char* refused;      // a failed send's line, up to its description
    bool aidl;                // ISO data passes, a failed send ends the bridge, btHci stays empty
};

const Hal kHals[] = {
        {"HIDL", installHidl, static_cast<int>(HidlStatus::INITIALIZATION_ERROR),
         {"hidl_client_init: use HIDL", "hidl_client_initialize: HIDL = true"},
         "hidl_client_initialize: the AIDL Bluetooth HAL is declared: using it",
         {"Error in HIDL initialization", "hidl_client_initialize: HIDL failed to initialize, sending invalid FD to tool"},
         "process_tool_data: the HAL refused packet type 1: ",
         false},
        {"AIDL", installAidl, static_cast<int>(AidlStatus::HARDWARE_INITIALIZATION_ERROR),
         {"hidl_client_initialize: the AIDL Bluetooth HAL is declared: using it", "hidl_client_initialize: AIDL = true"},
         "hidl_client_init: use HIDL",
         {"initializationComplete: the AIDL HAL failed to initialize: HARDWARE_INITIALIZATION_ERROR: the controller "
          "failed to initialize",
          "hidl_client_initialize: the AIDL HAL failed to initialize, sending invalid FD to tool"},
         "process_tool_data: the AIDL HAL refused packet type 1: ",
         true},
};

void PrintTo(const Hal& hal, std::ostream* os) { *os << hal.name; }

class SessionTest : public ::testing::TestWithParam<Hal> {
  protected: void SetUp() override {
        fds_before = countOpenFds();
        threads_before = countThreads();
    }
    void TearDown() override {
        hidl_client_close_tool_end();
        hidl_client_close();
        FakeHal::unregisterDefault();
        FakeAidlHal::unregisterDefault();
        EXPECT_EQ(fds_before, countOpenFds());
        EXPECT_LE(settledThreadCount(threads_before), threads_before);
    }
    std::shared_ptr<HalScript> installHal(InitMode mode = InitMode::Sync) { return GetParam().install(mode, 0); }
    bool logged(const char* line) const { return log.contains(ERROR, line) || log.contains(INFO, line); }

    LogCapture log;
    int fds_before = 0;
    int threads_before = 0;
};

INSTANTIATE_TEST_SUITE_P(BothHals, SessionTest, ::testing::ValuesIn(kHals),
                         [](const ::testing::TestParamInfo<Hal>& info) { return std::string(info.param.name); });

TEST_P(SessionTest, OpeningHandsOutTheToolEndAndPacketsPassBothWays) {
    const Hal& h = GetParam();
    std::shared_ptr<HalScript> hal = installHal(InitMode::Async);
    cmd_test_end_flag = 1;
    hidl_client_init();

    ASSERT_GE(bt_fd, 0);
    EXPECT_EQ(bt_fd, client_fd);
    EXPECT_NE(server_fd, client_fd);
    EXPECT_EQ(0, cmd_test_end_flag);
    for (const char* line : h.opened) EXPECT_TRUE(logged(line)) << line;
    EXPECT_FALSE(log.containsFragment(h.other));
    EXPECT_EQ(!h.aidl, btHci != nullptr) << "btHci holds the HIDL service only";
    EXPECT_TRUE(log.contains(INFO, "init cmd_test_end_flag = false"));
    EXPECT_TRUE(log.contains(ERROR, "Server FD=" + std::to_string(server_fd) + "  Client FD: " +
                                            std::to_string(client_fd) + "\n"));
    // Between them, packets whose size disagrees with their own header: each would
    // shift every packet after it, so each is dropped with its line.
    hal->deliverEvent({0x0E, 0x04, 0x01, 0x03, 0x0C, 0x00});
    hal->deliverEvent({0x0E, 0x06, 0x01, 0x03, 0x0C, 0x00});
    hal->deliverEvent({});
    hal->deliverAcl({0x01, 0x20, 0x01, 0x00, 0xAA});
    hal->deliverAcl({0x01, 0x20, 0x05, 0x00, 0xAA});
    hal->deliverSco({0x01, 0x00, 0x01});
    hal->deliverSco({0x01, 0x00, 0x01, 0x99});
    Bytes expected = {0x04, 0x0E, 0x04, 0x01, 0x03, 0x0C, 0x00, 0x02, 0x01, 0x20, 0x01, 0x00, 0xAA, 0x03, 0x01, 0x00, 0x01, 0x99};
    if (h.aidl) {
        hal->deliver(5, {0x01, 0x00, 0x02, 0x00, 0xAB, 0xCD});
        hal->deliver(5, {0x01, 0x00, 0x03, 0x00, 0xAB});
        expected.insert(expected.end(), {0x05, 0x01, 0x00, 0x02, 0x00, 0xAB, 0xCD});
    }
    EXPECT_EQ(expected, readBytes(bt_fd, expected.size()));
    EXPECT_TRUE(staysQuiet(bt_fd, 50));
    for (const char* line : {"hciEventReceived: packet of 6 bytes disagrees with its header, dropped",
                             "hciEventReceived: packet of 0 bytes disagrees with its header, dropped",
                             "aclDataReceived: packet of 5 bytes disagrees with its header, dropped",
                             "scoDataReceived: packet of 3 bytes disagrees with its header, dropped"}) {
        EXPECT_TRUE(logged(line)) << line;
    }
    if (h.aidl) {
        EXPECT_TRUE(logged("isoDataReceived: packet of 5 bytes disagrees with its header, dropped"));
    }

    // The other way, each packet reaches the HAL's call for its type; ISO only where the HAL takes it.
    std::vector<SentPacket> sent = {{1, {0x03, 0x0C, 0x00}}, {2, {0x01, 0x20, 0x01, 0x00, 0xAA}}, {3, {0x01, 0x00, 0x01, 0x99}}};
    if (h.aidl) sent.push_back({5, {0x01, 0x00, 0x02, 0x00, 0xAB, 0xCD}});
    for (const SentPacket& p : sent) {
        Bytes h4 = p.bytes;
        h4.insert(h4.begin(), p.type);
        writeAll(bt_fd, h4);
    }
    ASSERT_TRUE(hal->waitForSent(sent.size()));
    for (size_t i = 0; i < sent.size(); ++i) {
        EXPECT_EQ(sent[i].type, hal->sent()[i].type);
        EXPECT_EQ(sent[i].bytes, hal->sent()[i].bytes);
    }
}

// A failed opening leaves nothing open: no session, and no initialised HAL.
TEST_P(SessionTest, FailedOpeningsLeaveNoSessionAndNoHal) {
    const Hal& h = GetParam();
    for (auto mode : {InitMode::Sync, InitMode::Async}) {  // answered on either thread
        log.clear();
        std::shared_ptr<HalScript> hal = h.install(mode, h.failure);
        hidl_client_init();
        EXPECT_EQ(-1, bt_fd);
        EXPECT_EQ(-1, server_fd);
        for (const char* line : h.failed) EXPECT_TRUE(logged(line)) << line;
        EXPECT_EQ(1, hal->closeCalls());
        EXPECT_EQ(nullptr, btHci.get());
        log.clear();
        hidl_client_close();
        EXPECT_EQ(1u, log.lines().size()) << "only: Hidl init = false";
    }
}

// A HAL that never answers must not hang the opening, which then gives the
// HAL back; its late answer must not complete a later opening.
TEST_P(SessionTest, LateAnswerToAnAbandonedOpeningIsIgnored) {
    std::shared_ptr<HalScript> first = installHal(InitMode::Never);
    hidl_client_init();  // gives up after its 10 s bound
    EXPECT_TRUE(logged("hidl_client_initialize: no answer from the HAL within 10000 ms"));
    EXPECT_EQ(1, first->closeCalls());
    EXPECT_EQ(nullptr, btHci.get());
    std::shared_ptr<HalScript> next = installHal(InitMode::Never);
    int fd = -1;
    bool opened = true;
    std::thread opener([&] { opened = hidl_client_initialize(0, &fd); });
    ASSERT_TRUE(next->waitForInitialize());
    first->answerInitialize(0);
    EXPECT_TRUE(log.waitFor(ERROR, "initializationComplete: answer to an abandoned opening ignored"));
    next->answerInitialize(GetParam().failure);
    opener.join();
    EXPECT_FALSE(opened);
}

// A HAL that dies before it answers ends the opening's wait at once, not
// after its 10 s bound.
TEST_P(SessionTest, DeathDuringTheOpeningEndsItsWait) {
    std::shared_ptr<HalScript> hal = installHal(InitMode::Never);
    bool opened = true;
    std::thread opener([&] { opened = hidl_client_initialize(0, &bt_fd); });
    ASSERT_TRUE(hal->waitForInitialize());
    auto died = std::chrono::steady_clock::now();
    hal->die();
    opener.join();
    EXPECT_FALSE(opened);
    EXPECT_LT(std::chrono::steady_clock::now() - died, std::chrono::seconds(5));
    EXPECT_TRUE(logged("serviceDied: the Bluetooth HAL died"));
}

// Events from several HAL threads at once: each arrives whole, and each
// thread's events keep their order.
TEST_P(SessionTest, ConcurrentCallbacksNeverInterleavePackets) {
    std::shared_ptr<HalScript> hal = installHal();
    hidl_client_init();
    ASSERT_GE(bt_fd, 0);
    const int kThreads = 4, kEvents = 300;
    std::map<int, int> next_seq;
    int bad = 0, total = 0;
    std::thread reader([&] {
        for (; total < kThreads * kEvents; ++total) {
            Bytes head = readBytes(bt_fd, 3);
            Bytes body = head.size() == 3 ? readBytes(bt_fd, head[2]) : Bytes();
            if (head.size() != 3 || head[0] != 0x04 || body.size() != head[2]) return (void)++bad;
            for (size_t i = 3; i < body.size(); ++i) bad += body[i] != body[0];
            bad += (body[1] | (body[2] << 8)) != next_seq[body[0]]++;
        }
    });
    std::vector<std::thread> senders;
    for (int t = 0; t < kThreads; ++t) {
        senders.emplace_back([&, t] {
            for (int i = 0; i < kEvents; ++i) {
                uint8_t len = static_cast<uint8_t>(3 + (i * 37 + t * 11) % 250);
                Bytes ev(2 + len, static_cast<uint8_t>(t));
                ev[0] = 0xFF;
                ev[1] = len;
                ev[3] = static_cast<uint8_t>(i & 0xFF);
                ev[4] = static_cast<uint8_t>(i >> 8);
                hal->deliverEvent(ev);
            }
        });
    }
    for (auto& s : senders) s.join();
    reader.join();
    EXPECT_EQ(0, bad);
    EXPECT_EQ(kThreads * kEvents, total);
}

// A late callback must not write into whatever took over the number of the
// closed bridge end.
TEST_P(SessionTest, LateCallbackNeverWritesIntoAReusedDescriptor) {
    std::shared_ptr<HalScript> hal = installHal();
    hidl_client_init();
    int old_server = server_fd;
    hidl_client_close_tool_end();
    hidl_client_close();
    int reused[2];
    ASSERT_EQ(0, socketpair(AF_UNIX, SOCK_STREAM, 0, reused));
    ASSERT_TRUE(reused[0] == old_server || reused[1] == old_server);
    hal->deliverEvent({0x0E, 0x01, 0x00});  // through the closed session's callbacks
    EXPECT_TRUE(staysQuiet(reused[0] == old_server ? reused[1] : reused[0], 50));
    EXPECT_TRUE(logged("hciEventReceived: failed to write event to tool socket"));
    close(reused[0]);
    close(reused[1]);
}

// Closing while the engine writes: the pump is joined before the service is
// closed, so nothing reaches a closed service; a second close does nothing.
TEST_P(SessionTest, CloseJoinsThePumpBeforeTheServiceIsClosed) {
    for (int round = 0; round < 20; ++round) {
        std::shared_ptr<HalScript> hal = installHal();
        hidl_client_init();
        ASSERT_GE(client_fd, 0);
        std::atomic<bool> stop{false};
        int tool = client_fd;
        std::thread writer([&] {
            const uint8_t reset[] = {0x01, 0x03, 0x0C, 0x00};
            while (!stop && send(tool, reset, sizeof(reset), MSG_DONTWAIT | MSG_NOSIGNAL) >= 0) {
            }
        });
        ASSERT_TRUE(hal->waitForSent(3));
        hidl_client_close();
        stop = true;
        writer.join();
        hidl_client_close();
        EXPECT_FALSE(hal->sentAfterClose());
        EXPECT_EQ(1, hal->closeCalls());
        EXPECT_EQ(-1, server_fd);
        EXPECT_EQ(nullptr, btHci.get());
        hidl_client_close_tool_end();
    }
    EXPECT_TRUE(log.contains(INFO, "hidl_client_close: Close HIDL with Mode BT"));
}

TEST_P(SessionTest, ReopeningEndsTheEarlierSessionFirst) {
    std::shared_ptr<HalScript> first = installHal();
    hidl_client_init();
    int fds_open = countOpenFds();
    std::shared_ptr<HalScript> second = installHal();
    int tool = -1;
    ASSERT_TRUE(hidl_client_initialize(0, &tool));
    EXPECT_EQ(1, first->closeCalls());
    EXPECT_EQ(fds_open, countOpenFds());
    EXPECT_EQ(-1, bt_fd);  // the earlier tool end is gone
    second->deliverEvent({0x0E, 0x01, 0x00});
    EXPECT_EQ((Bytes{0x04, 0x0E, 0x01, 0x00}), readBytes(tool, 4));
}

// A HAL that dies, between calls or at a send, ends the bridge at once: the
// engine's wait ends on the closed stream, well within its 2 s bound. So does
// a failed send on AIDL; HIDL goes on after a send refused by a living HAL.
TEST_P(SessionTest, DeathOrAFailedSendEndsTheBridgeAtOnce) {
    const Hal& h = GetParam();
    for (HalScript::Call call : {HalScript::Call::None, HalScript::Call::Send, HalScript::Call::RefuseSend}) {
        log.clear();
        std::shared_ptr<HalScript> hal = installHal();
        hidl_client_init();
        ASSERT_GE(bt_fd, 0);
        bool dies = call != HalScript::Call::RefuseSend;
        if (call == HalScript::Call::None) {
            hal->die();
        } else {
            hal->dieAt(call);
            writeAll(bt_fd, {0x01, 0x03, 0x0C, 0x00});
        }
        uint8_t byte;
        bool ended = waitUntil([&] { return recv(bt_fd, &byte, 1, MSG_DONTWAIT) == 0; }, 500);
        EXPECT_EQ(dies || h.aidl, ended) << static_cast<int>(call);
        EXPECT_EQ(dies, logged("serviceDied: the Bluetooth HAL died")) << static_cast<int>(call);
        EXPECT_EQ(call != HalScript::Call::None, log.containsFragment(h.refused)) << static_cast<int>(call);
        hidl_client_close_tool_end();
        hidl_client_close();
        FakeHal::unregisterDefault();
        FakeAidlHal::unregisterDefault();
    }
}

class AidlHalTest : public SessionTest {};

struct AidlFailure {
    bool registered;  // declared only, when not
    AidlStatus status;
    const char* line;
    int closes;
};

// Each status is named; a HAL another client holds is released without
// closing it, which would take it from that client.
TEST_F(AidlHalTest, EachFailureIsNamedAndAHeldHalIsNeverClosed) {
    const AidlFailure kFailures[] = {
            {true, AidlStatus::UNABLE_TO_OPEN_INTERFACE,
             "initializationComplete: the AIDL HAL failed to initialize: UNABLE_TO_OPEN_INTERFACE: the HAL cannot open "
             "its interface to the controller", 1},
            {true, AidlStatus::ALREADY_INITIALIZED,
             "initializationComplete: the AIDL HAL failed to initialize: ALREADY_INITIALIZED: the HAL is in use, usually "
             "by the phone's own Bluetooth: turn Bluetooth off and try again", 0},
            {false, AidlStatus::SUCCESS,
             "hidl_client_initialize: the AIDL Bluetooth HAL android.hardware.bluetooth.IBluetoothHci/default is "
             "declared but not running", 0},
    };
    for (const AidlFailure& f : kFailures) {
        log.clear();
        std::shared_ptr<FakeAidlHal> hal = ndk::SharedRefBase::make<FakeAidlHal>(InitMode::Sync, f.status);
        if (f.registered) hal->registerDefault();
        else ndk::host::setDeclared(kAidlName.c_str(), true);
        hidl_client_init();
        EXPECT_EQ(-1, bt_fd);
        EXPECT_TRUE(logged(f.line)) << f.line;
        EXPECT_EQ(f.closes, hal->closeCalls()) << f.line;
        EXPECT_FALSE(log.containsFragment("Initialize the HIDL")) << "HIDL is not tried on a phone with the AIDL HAL";
        FakeAidlHal::unregisterDefault();
    }
}

}  // namespace

// Which HAL is opened: the AIDL one where the service manager says it is
// declared, else HIDL, as the platform's own stack chooses.
TEST(HalChoice, AidlWhereDeclaredAndTheServiceManagerCanSay) {
    LogCapture log;
    for (bool declared : {true, false}) {
        log.clear();
        sp<FakeHal> hidl = new FakeHal();
        hidl->registerDefault();
        std::shared_ptr<FakeAidlHal> aidl = ndk::SharedRefBase::make<FakeAidlHal>();
        aidl->registerDefault();
        ndk::host::setDeclared(kAidlName.c_str(), declared);
        hidl_client_init();
        bool aidl_expected = declared && SESSION_TEST_API >= 31;
        EXPECT_GE(bt_fd, 0);
        EXPECT_EQ(aidl_expected ? 1 : 0, aidl->initializeCalls()) << "declared " << declared;
        EXPECT_EQ(aidl_expected ? 0 : 1, hidl->initializeCalls()) << "declared " << declared;
        EXPECT_EQ(!aidl_expected, log.contains(ANDROID_LOG_ERROR, "hidl_client_init: use HIDL"));
        hidl_client_close_tool_end();
        hidl_client_close();
        FakeHal::unregisterDefault();
        FakeAidlHal::unregisterDefault();
    }
}
