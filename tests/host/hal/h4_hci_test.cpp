// The H4 backends, each against a real far end (a unix listener, a loopback
// TCP listener, a pseudo-terminal): one suite of reassembly, sending and
// failure cases run on all three.
#include "host/hal/h4_hci.h"

#include <arpa/inet.h>
#include <fcntl.h>
#include <netinet/in.h>
#include <poll.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <chrono>
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
  public:
    virtual ~FarEnd() {
        if (fd >= 0) close(fd);
        if (listener >= 0) close(listener);
    }
    virtual std::string hci() = 0;           // the HALVENOR_HCI value that reaches it
    virtual std::string unreachable() = 0;   // one of the same kind that reaches nothing
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
    // True once the backend's end is gone: end of stream, hang-up or error.
    bool sawDisconnect() {
        return waitUntil([this] {
            struct pollfd pfd = {fd, POLLIN, 0};
            if (poll(&pfd, 1, 0) != 1) return false;
            if (pfd.revents & (POLLHUP | POLLERR)) return true;
            char c;
            return read(fd, &c, 1) <= 0;
        });
    }
    int fd = -1;
    int listener = -1;
};

class UnixFarEnd : public FarEnd {
  public:
    UnixFarEnd() : path_(tempPath("h4.sock")) {
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
    std::string unreachable() override { return "unix:" + tempPath("absent.sock"); }

  private:
    std::string path_;
};

// Binds 127.0.0.1 port 0; returns the port.
int bindLoopback(int fd) {
    struct sockaddr_in addr = {};
    addr.sin_family = AF_INET;
    addr.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    socklen_t len = sizeof(addr);
    bind(fd, reinterpret_cast<sockaddr*>(&addr), len);
    getsockname(fd, reinterpret_cast<sockaddr*>(&addr), &len);
    return ntohs(addr.sin_port);
}

class TcpFarEnd : public FarEnd {
  public:
    TcpFarEnd() {
        listener = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
        port_ = bindLoopback(listener);
        listen(listener, 1);
    }
    std::string hci() override { return "tcp:127.0.0.1:" + std::to_string(port_); }
    std::string unreachable() override {
        int s = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
        int port = bindLoopback(s);  // a port nobody listens on
        close(s);
        return "tcp:127.0.0.1:" + std::to_string(port);
    }

  private:
    int port_ = 0;
};

class PtyFarEnd : public FarEnd {
  public:
    PtyFarEnd() {
        fd = posix_openpt(O_RDWR | O_NOCTTY | O_CLOEXEC);
        grantpt(fd);
        unlockpt(fd);
        name_ = ptsname(fd);
    }
    std::string hci() override { return "tty:" + name_ + ",921600"; }
    std::string unreachable() override { return "tty:/dev/halvenor-absent-tty"; }
    bool accept() override { return fd >= 0; }

  private:
    std::string name_;
};

using FarEndFactory = std::unique_ptr<FarEnd> (*)();

class H4HciTest : public ::testing::TestWithParam<FarEndFactory> {
  protected:
    void SetUp() override {
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
    void writeFar(const Bytes& bytes, size_t from, size_t to) {
        writeAll(far->fd, Bytes(bytes.begin() + from, bytes.begin() + to));
    }

    std::unique_ptr<FarEnd> far;
    sp<RecordingCallbacks> callbacks;
    sp<IBluetoothHci> hci;
    LogCapture log;
    int threads_before = 0;
};

std::vector<Received> controllerPackets() {
    Bytes acl = {0x01, 0x20, 0x2C, 0x01};  // 300 bytes of data
    for (int i = 0; i < 300; ++i) acl.push_back(static_cast<uint8_t>(i));
    return {
            {4, {0x0E, 0x04, 0x01, 0x03, 0x0C, 0x00}},
            {2, {0x02, 0x00, 0x00, 0x00}},
            {3, {0x03, 0x00, 0x02, 0x11, 0x22}},
            {2, acl},
            {4, {0x0F, 0x04, 0x01, 0x01, 0x22, 0x0C}},
    };
}

Bytes streamOf(const std::vector<Received>& packets) {
    Bytes out;
    for (const auto& p : packets) {
        Bytes one = h4(p.type, p.bytes);
        out.insert(out.end(), one.begin(), one.end());
    }
    return out;
}

void expectPackets(const std::vector<Received>& want, const std::vector<Received>& got, size_t from,
                   const std::string& how) {
    ASSERT_EQ(want.size(), got.size() - from) << how;
    for (size_t i = 0; i < want.size(); ++i) {
        EXPECT_EQ(want[i].type, got[from + i].type) << how << " packet " << i;
        EXPECT_EQ(want[i].bytes, got[from + i].bytes) << how << " packet " << i;
    }
}

TEST_P(H4HciTest, ConnectsAndReportsSuccessOnce) {
    connect();
    hci->sendHciCommand(hidl_vec<uint8_t>({0x03, 0x0C, 0x00}));
    EXPECT_EQ((Bytes{1, 0x03, 0x0C, 0x00}), readBytes(far->fd, 4));
    EXPECT_EQ(1, callbacks->initCount());
}

TEST_P(H4HciTest, SendsEachPacketWithItsTypeByte) {
    connect();
    Bytes cmd = {0x1D, 0x20, 0x01, 0x13};
    Bytes acl = {0x01, 0x00, 0xE8, 0x03};  // 1000 bytes of data
    for (int i = 0; i < 1000; ++i) acl.push_back(static_cast<uint8_t>(i * 7));
    Bytes sco = {0x01, 0x00, 0x01, 0x55};
    hci->sendHciCommand(cmd);
    hci->sendAclData(acl);
    hci->sendScoData(sco);
    Bytes want = h4(1, cmd), a = h4(2, acl), s = h4(3, sco);
    want.insert(want.end(), a.begin(), a.end());
    want.insert(want.end(), s.begin(), s.end());
    EXPECT_EQ(want, readBytes(far->fd, want.size()));
}

TEST_P(H4HciTest, ReassemblesControllerStreamSplitAtEveryOffset) {
    connect();
    std::vector<Received> want = controllerPackets();
    Bytes stream = streamOf(want);
    for (size_t cut = 0; cut <= stream.size(); ++cut) {
        size_t before = callbacks->packets().size();
        writeFar(stream, 0, cut);
        writeFar(stream, cut, stream.size());
        ASSERT_TRUE(callbacks->waitForPackets(before + want.size())) << "cut at " << cut;
        expectPackets(want, callbacks->packets(), before, "cut at " + std::to_string(cut));
    }
}

TEST_P(H4HciTest, ReassemblesOneByteSlices) {
    connect();
    std::vector<Received> want = controllerPackets();
    Bytes stream = streamOf(want);
    for (size_t i = 0; i < stream.size(); ++i) writeFar(stream, i, i + 1);
    ASSERT_TRUE(callbacks->waitForPackets(want.size()));
    expectPackets(want, callbacks->packets(), 0, "1-byte slices");
}

// A controller gone is a HAL gone: the service dies, and says so to every call.
TEST_P(H4HciTest, UnknownTypeByteEndsSession) {
    connect();
    writeAll(far->fd, {0x04, 0x13, 0x00, 0x07, 0x04, 0x13, 0x00});
    ASSERT_TRUE(waitUntil([&] { return log.containsFragment("controller sent unknown packet type 0x07"); }));
    ASSERT_EQ(1u, callbacks->packets().size()) << "the packet before the bad byte only";
    EXPECT_TRUE(hci->sendHciCommand(hidl_vec<uint8_t>({0x03, 0x0C, 0x00})).isDeadObject());
    EXPECT_TRUE(readBytes(far->fd, 1, 200).empty()) << "nothing sent after the session ended";
}

TEST_P(H4HciTest, LostConnectionMidPacketEndsSession) {
    connect();
    writeAll(far->fd, {0x04, 0x0E, 0x04, 0x01});
    far->hangUp();
    ASSERT_TRUE(waitUntil([&] { return log.containsFragment("h4: " + far->hci() + ": "); }));
    // A pseudo-terminal's hang-up may flush input not yet read, so only a
    // socket is sure to have delivered the half packet.
    if (far->listener >= 0) {
        EXPECT_TRUE(log.containsFragment("controller closed the connection in the middle of a packet"));
    }
    EXPECT_TRUE(callbacks->packets().empty());
    EXPECT_TRUE(hci->sendHciCommand(hidl_vec<uint8_t>({0x03, 0x0C, 0x00})).isDeadObject());
}

TEST_P(H4HciTest, CloseDisconnectsFarEnd) {
    connect();
    hci->close();
    EXPECT_TRUE(far->sawDisconnect());
    EXPECT_LE(settledThreadCount(threads_before), threads_before);
}

TEST_P(H4HciTest, UnreachableTargetFailsInitialisation) {
    std::string target = far->unreachable();
    hci = serviceFor(target.c_str());
    ASSERT_NE(nullptr, hci.get());
    auto start = std::chrono::steady_clock::now();
    hci->initialize(callbacks);
    HciStatus status;
    ASSERT_TRUE(callbacks->waitForInit(&status));
    EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(4));
    EXPECT_EQ(HciStatus::INITIALIZATION_ERROR, status);
    EXPECT_TRUE(log.containsFragment("h4: cannot reach " + target + ": "));
    hci->close();
    EXPECT_EQ(1, callbacks->initCount());
}

std::unique_ptr<FarEnd> unixFarEnd() { return std::unique_ptr<FarEnd>(new UnixFarEnd()); }
std::unique_ptr<FarEnd> tcpFarEnd() { return std::unique_ptr<FarEnd>(new TcpFarEnd()); }
std::unique_ptr<FarEnd> ptyFarEnd() { return std::unique_ptr<FarEnd>(new PtyFarEnd()); }

std::string backendName(const ::testing::TestParamInfo<FarEndFactory>& info) {
    const char* names[] = {"Unix", "Tcp", "Tty"};
    return names[info.index];
}

INSTANTIATE_TEST_SUITE_P(Backends, H4HciTest, ::testing::Values(unixFarEnd, tcpFarEnd, ptyFarEnd),
                         backendName);

// A listener whose accept queue is full never completes a connect.
TEST(H4HciBoundTest, ConnectThatNeverCompletesFailsWithinBound) {
    LogCapture log;
    int listener = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    int port = bindLoopback(listener);
    listen(listener, 0);
    std::vector<int> fillers;
    struct sockaddr_in addr = {};
    addr.sin_family = AF_INET;
    addr.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    addr.sin_port = htons(static_cast<uint16_t>(port));
    for (int i = 0; i < 4; ++i) {
        int s = socket(AF_INET, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0);
        connect(s, reinterpret_cast<sockaddr*>(&addr), sizeof(addr));
        fillers.push_back(s);
    }
    std::string target = "tcp:127.0.0.1:" + std::to_string(port);
    sp<RecordingCallbacks> callbacks = new RecordingCallbacks();
    sp<IBluetoothHci> hci = serviceFor(target.c_str());
    auto start = std::chrono::steady_clock::now();
    hci->initialize(callbacks);
    HciStatus status;
    ASSERT_TRUE(callbacks->waitForInit(&status));
    auto took = std::chrono::steady_clock::now() - start;
    EXPECT_EQ(HciStatus::INITIALIZATION_ERROR, status);
    EXPECT_LT(took, std::chrono::seconds(5));
    EXPECT_TRUE(log.containsFragment("h4: cannot reach " + target + ": no answer within 3000 ms"));
    hci->close();
    for (int s : fillers) close(s);
    close(listener);
    unsetenv("HALVENOR_HCI");
}

}  // namespace
