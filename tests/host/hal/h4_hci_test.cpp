// The H4 backends against a real far end, a unix listener or a
// pseudo-terminal: packets both ways, reassembly, and a controller that
// leaves.
#include "host/hal/h4_hci.h"

#include <fcntl.h>
#include <poll.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <memory>

#include <gtest/gtest.h>

#include "tests/host/host_test_support.h"
#include "tests/support/log_capture.h"
#include "tests/support/process.h"

using android::sp;
using android::hardware::hidl_vec;
using android::hardware::bluetooth::V1_0::IBluetoothHci;

namespace {

// The controller's side of the connection.
class FarEnd {
  public: virtual ~FarEnd() {
        if (fd >= 0) close(fd);
        if (listener >= 0) close(listener);
    }
    virtual std::string hci() = 0;           // the HALVENOR_HCI value that reaches it
    // After the backend has connected: the descriptor to talk to it through.
    virtual bool accept() {
        struct pollfd pfd = {listener, POLLIN, 0};
        if (poll(&pfd, 1, 5000) != 1) return false;
        fd = ::accept4(listener, nullptr, nullptr, SOCK_CLOEXEC);
        return fd >= 0;
    }
    void hangUp() {
        close(fd);
        fd = -1;
    }
    int fd = -1;
    int listener = -1;
};

class UnixFarEnd : public FarEnd {
  public: UnixFarEnd() : path_(tempPath("h4.sock")) {
        listener = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
        struct sockaddr_un addr = {};
        addr.sun_family = AF_UNIX;
        snprintf(addr.sun_path, sizeof(addr.sun_path), "%s", path_.c_str());
        unlink(path_.c_str());
        bind(listener, reinterpret_cast<sockaddr*>(&addr), sizeof(addr));
        listen(listener, 1);
    }
    ~UnixFarEnd() override { unlink(path_.c_str()); }
    std::string hci() override { return "unix:" + path_; }

  private: std::string path_;
};

class PtyFarEnd : public FarEnd {
  public: PtyFarEnd() {
        fd = posix_openpt(O_RDWR | O_NOCTTY | O_CLOEXEC);
        grantpt(fd);
        unlockpt(fd);
        name_ = ptsname(fd);
    }
    std::string hci() override { return "tty:" + name_ + ",921600"; }
    bool accept() override { return fd >= 0; }

  private: std::string name_;
};

using FarEndFactory = std::unique_ptr<FarEnd> (*)();

class H4HciTest : public ::testing::TestWithParam<FarEndFactory> {
  protected: void SetUp() override {
        threads_before = countThreads();
        far = GetParam()();
        callbacks = new RecordingCallbacks();
    }
    void TearDown() override {
        if (hci != nullptr) hci->close().isOk();  // a service whose controller left has died
        hci.clear();
        callbacks.clear();
        far.reset();
        unsetenv("HALVENOR_HCI");
        EXPECT_LE(settledThreadCount(threads_before), threads_before) << "reader thread joined";
    }
    // Connects the backend to the far end and waits for its success.
    void connect() {
        hci = serviceFor(far->hci().c_str());
        ASSERT_NE(nullptr, hci.get());
        hci->initialize(callbacks);
        ASSERT_TRUE(far->accept());
        HciStatus status;
        ASSERT_TRUE(callbacks->waitForInit(&status));
        ASSERT_EQ(HciStatus::SUCCESS, status);
    }

    std::unique_ptr<FarEnd> far;
    sp<RecordingCallbacks> callbacks;
    sp<IBluetoothHci> hci;
    LogCapture log;
    int threads_before = 0;
};

// Packets both ways, the controller's stream split at every offset, then a
// controller that leaves: the service dies, and says so to every call.
TEST_P(H4HciTest, CarriesPacketsBothWaysAndDiesWithItsController) {
    connect();
    Bytes acl = {0x01, 0x00, 0xE8, 0x03};  // 1000 bytes of data
    for (int i = 0; i < 1000; ++i) acl.push_back(static_cast<uint8_t>(i * 7));
    EXPECT_TRUE(hci->sendHciCommand(hidl_vec<uint8_t>({0x1D, 0x20, 0x01, 0x13})).isOk());
    EXPECT_TRUE(hci->sendAclData(acl).isOk());
    EXPECT_TRUE(hci->sendScoData(hidl_vec<uint8_t>({0x01, 0x00, 0x01, 0x55})).isOk());
    Bytes want = h4(1, {0x1D, 0x20, 0x01, 0x13}), a = h4(2, acl), sco = h4(3, {0x01, 0x00, 0x01, 0x55});
    want.insert(want.end(), a.begin(), a.end());
    want.insert(want.end(), sco.begin(), sco.end());
    EXPECT_EQ(want, readBytes(far->fd, want.size()));

    const std::vector<Received> packets = {{4, {0x0E, 0x04, 0x01, 0x03, 0x0C, 0x00}}, {2, {0x02, 0x00, 0x00, 0x00}},
                                           {3, {0x03, 0x00, 0x02, 0x11, 0x22}}, {2, acl}};
    Bytes stream;
    for (const auto& p : packets) {
        Bytes one = h4(p.type, p.bytes);
        stream.insert(stream.end(), one.begin(), one.end());
    }
    for (size_t cut = 0; cut <= stream.size(); cut += cut < 20 ? 1 : 97) {
        size_t before = callbacks->packets().size();
        writeAll(far->fd, Bytes(stream.begin(), stream.begin() + cut));
        writeAll(far->fd, Bytes(stream.begin() + cut, stream.end()));
        ASSERT_TRUE(callbacks->waitForPackets(before + packets.size())) << "cut at " << cut;
        for (size_t i = 0; i < packets.size(); ++i) {
            EXPECT_EQ(packets[i].bytes, callbacks->packets()[before + i].bytes) << "cut at " << cut;
        }
    }

    writeAll(far->fd, {0x04, 0x13, 0x00, 0x07});  // an event, then a type byte no packet has
    ASSERT_TRUE(waitUntil([&] { return log.containsFragment("h4: " + far->hci() + ": controller sent unknown packet type 0x07"); }));
    EXPECT_TRUE(hci->sendHciCommand(hidl_vec<uint8_t>({0x03, 0x0C, 0x00})).isDeadObject());
    EXPECT_TRUE(readBytes(far->fd, 1, 200).empty()) << "nothing sent after the session ended";
}

TEST_P(H4HciTest, ControllerClosingKillsTheService) {
    connect();
    far->hangUp();
    // A pseudo-terminal's hang-up is an error to read, a socket's an end of stream.
    ASSERT_TRUE(waitUntil([&] { return log.containsFragment(far->listener < 0 ? "h4: " + far->hci() + ": "
                                                                             : "controller closed the connection"); }));
    EXPECT_TRUE(hci->sendHciCommand(hidl_vec<uint8_t>({0x03, 0x0C, 0x00})).isDeadObject());
}

std::unique_ptr<FarEnd> unixFarEnd() { return std::unique_ptr<FarEnd>(new UnixFarEnd()); }
std::unique_ptr<FarEnd> ptyFarEnd() { return std::unique_ptr<FarEnd>(new PtyFarEnd()); }

std::string backendName(const ::testing::TestParamInfo<FarEndFactory>& info) {
    const char* names[] = {"Unix", "Tty"};
    return names[info.index];
}

INSTANTIATE_TEST_SUITE_P(Backends, H4HciTest, ::testing::Values(unixFarEnd, ptyFarEnd), backendName);

}  // namespace
