// The H4 backends against a real far end, a unix listener, a pseudo-terminal
// or an adapter's user channel (a SOCK_SEQPACKET pair in the kernel's place):
// packets both ways, reassembly, a controller that leaves or stops taking
// bytes; the user channel's bind errors and its binding once; and the capture
// they write.
#include "host/hal/h4_hci.h"
#include "host/hal/btsnoop.h"
#include "host/hal/hci_user.h"

#include <netdb.h>

#include <fcntl.h>
#include <poll.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <termios.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <fstream>
#include <iterator>
#include <map>
#include <memory>
#include <thread>

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
    // Stops taking bytes: a serial line's flow control held; a socket simply unread.
    virtual void holdFlow() {}
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
    ~PtyFarEnd() override {
        if (held_ >= 0) close(held_);
    }
    std::string hci() override { return "tty:" + name_ + ",921600"; }
    bool accept() override { return fd >= 0; }
    // The line's own output stopped, as CTS low stops a UART's.
    void holdFlow() override {
        held_ = open(name_.c_str(), O_RDWR | O_NOCTTY);
        tcflow(held_, TCOOFF);
    }

  private: std::string name_;
    int held_ = -1;
};

// The kernel's side of adapter hciN's user channel: one packet per read and
// per write, as the kernel gives them. Each far end has an index of its own,
// since a channel, once taken, is kept for the life of the process.
std::map<int, int> g_channels;  // index -> the backend's end, until taken
std::map<int, int> g_binds;     // index -> times bound

int pairOpener(int index) {
    ++g_binds[index];
    auto it = g_channels.find(index);
    if (it == g_channels.end()) return errno = ENODEV, -1;
    int fd = it->second;
    g_channels.erase(it);
    return fd;
}

class HciFarEnd : public FarEnd {
  public: HciFarEnd() {
        static int next_index = 100;
        index_ = next_index++;
        int pair[2];
        socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, pair);
        fd = pair[0];
        g_channels[index_] = pair[1];
        hci_user_use_opener(pairOpener);
    }
    ~HciFarEnd() override { hci_user_use_opener(nullptr); }
    std::string hci() override { return "hci:" + std::to_string(index_); }
    bool accept() override { return true; }
    // Gives the kernel's end a new descriptor, as an adapter that came back.
    void plugIn() {
        int pair[2];
        socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, pair);
        close(fd);
        fd = pair[0];
        g_channels[index_] = pair[1];
    }
    int binds() { return g_binds[index_]; }

  private: int index_;
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
    // A pseudo-terminal's hang-up is an error to read, a socket's an end of stream, an adapter's its removal.
    std::string target = far->hci();
    std::string line = target.rfind("tty:", 0) == 0 ? "h4: " + target + ": "
                       : target.rfind("hci:", 0) == 0 ? "h4: " + target + ": the adapter went away"
                                                      : "controller closed the connection";
    ASSERT_TRUE(waitUntil([&] { return log.containsFragment(line); })) << line;
    EXPECT_TRUE(hci->sendHciCommand(hidl_vec<uint8_t>({0x03, 0x0C, 0x00})).isDeadObject());
}

// A controller that stops taking bytes fails the send within the write bound,
// with the cause named, and closing the service does not wait for it.
TEST_P(H4HciTest, ControllerThatStopsTakingBytesFailsTheSendWithinItsBound) {
    connect();
    far->holdFlow();
    Bytes acl = {0x01, 0x00, 0xFF, 0xFF};
    acl.resize(4 + 0xFFFF, 0xA5);
    auto start = std::chrono::steady_clock::now();
    bool dead = false;
    for (int i = 0; i < 64 && !dead; ++i) dead = hci->sendAclData(acl).isDeadObject();
    EXPECT_TRUE(dead) << "a write never stalled";
    EXPECT_TRUE(log.containsFragment("h4: " + far->hci() + ": the controller is not taking bytes (")) ;
    EXPECT_TRUE(log.containsFragment(" for 2 s)"));
    EXPECT_TRUE(hci->close().isDeadObject());
    EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(8));
    hci.clear();
}

// getaddrinfo has no time-out: a resolver that never answers must not hold
// the opening past the connect bound.
std::atomic<bool> g_release_resolver{false};
int stuckResolver(const char*, const char*, const struct addrinfo*, struct addrinfo**) {
    while (!g_release_resolver) std::this_thread::sleep_for(std::chrono::milliseconds(10));
    return EAI_AGAIN;
}

TEST(H4TargetTest, StuckNameResolutionFailsTheOpeningWithinTheConnectBound) {
    LogCapture log;
    h4_use_resolver(stuckResolver);
    sp<IBluetoothHci> hci = serviceFor("tcp:resolver.stuck:4000");
    sp<RecordingCallbacks> callbacks = new RecordingCallbacks();
    hci->initialize(callbacks);
    HciStatus status;
    ASSERT_TRUE(callbacks->waitForInit(&status, 5000));
    EXPECT_EQ(HciStatus::INITIALIZATION_ERROR, status);
    EXPECT_TRUE(log.containsFragment("h4: cannot reach tcp:resolver.stuck:4000: host: no answer from the name "
                                     "resolver within 3000 ms"));
    g_release_resolver = true;
    h4_use_resolver(nullptr);
    hci->close().isOk();
    unsetenv("HALVENOR_HCI");
}

// The user's capture follows the wall clock; the console's, whose records
// time its counting windows, does not step with it.
int64_t g_wall_us = 1700000000000000;
int64_t fakeWallClock() { return g_wall_us; }

// Stamps of the records in a capture, microseconds since the Unix epoch.
std::vector<int64_t> stamps(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    Bytes file((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
    std::vector<int64_t> out;
    for (size_t at = 16; at + 24 <= file.size();) {
        uint64_t micros = 0;
        for (int i = 0; i < 8; ++i) micros = micros << 8 | file[at + 16 + i];
        out.push_back(static_cast<int64_t>(micros - 0x00DCDDB30F2F8000ULL));
        at += 24 + (file[at + 4] << 24 | file[at + 5] << 16 | file[at + 6] << 8 | file[at + 7]);
    }
    return out;
}

TEST(BtsnoopTest, ConsoleCaptureIgnoresAStepOfTheWallClock) {
    Btsnoop::useWallClock(fakeWallClock);
    std::string user = tempPath("user.btsnoop"), console = tempPath("console.btsnoop");
    auto userSnoop = Btsnoop::open(user), consoleSnoop = Btsnoop::open(console, true);
    const Bytes reset = {0x03, 0x0C, 0x00};
    for (int i = 0; i < 2; ++i) {
        userSnoop->record(1, reset.data(), reset.size(), false);
        consoleSnoop->record(1, reset.data(), reset.size(), false);
        g_wall_us += 3600LL * 1000000;  // the clock is set an hour ahead
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
    }
    std::vector<int64_t> u = stamps(user), c = stamps(console);
    ASSERT_EQ(2u, u.size());
    ASSERT_EQ(2u, c.size());
    EXPECT_EQ(3600LL * 1000000, u[1] - u[0]);
    EXPECT_GE(c[1] - c[0], 20000);
    EXPECT_LT(c[1] - c[0], 1000000);
    Btsnoop::useWallClock(nullptr);
    unlink(user.c_str());
    unlink(console.c_str());
}

std::unique_ptr<FarEnd> unixFarEnd() { return std::unique_ptr<FarEnd>(new UnixFarEnd()); }
std::unique_ptr<FarEnd> ptyFarEnd() { return std::unique_ptr<FarEnd>(new PtyFarEnd()); }
std::unique_ptr<FarEnd> hciFarEnd() { return std::unique_ptr<FarEnd>(new HciFarEnd()); }

std::string backendName(const ::testing::TestParamInfo<FarEndFactory>& info) {
    const char* names[] = {"Unix", "Tty", "UserChannel"};
    return names[info.index];
}

INSTANTIATE_TEST_SUITE_P(Backends, H4HciTest, ::testing::Values(unixFarEnd, ptyFarEnd, hciFarEnd), backendName);

// The channel is bound once and kept across the library's sessions, so the
// system cannot take the adapter back between them; an adapter that went
// away is bound anew, and what the kernel refuses says what to do.
TEST(HciUserTest, BoundOnceAcrossSessionsAndAnewAfterTheAdapterWentAway) {
    HciFarEnd far;
    for (int session = 0; session < 3; ++session) {
        sp<IBluetoothHci> hci = serviceFor(far.hci().c_str());
        sp<RecordingCallbacks> callbacks = new RecordingCallbacks();
        hci->initialize(callbacks);
        HciStatus status;
        ASSERT_TRUE(callbacks->waitForInit(&status));
        ASSERT_EQ(HciStatus::SUCCESS, status) << session;
        EXPECT_TRUE(hci->sendHciCommand(hidl_vec<uint8_t>({0x03, 0x0C, 0x00})).isOk());
        EXPECT_EQ(h4(1, {0x03, 0x0C, 0x00}), readBytes(far.fd, 4)) << session;
        if (session == 1) {
            far.plugIn();  // the old end closed: the adapter went away, and came back
            EXPECT_TRUE(waitUntil([&] { return hci->sendHciCommand(hidl_vec<uint8_t>({0x03, 0x0C, 0x00})).isDeadObject(); }));
        } else {
            hci->close().isOk();
        }
        EXPECT_EQ(session < 2 ? 1 : 2, far.binds()) << session;
    }
    unsetenv("HALVENOR_HCI");
}

struct BindRefusal {
    std::vector<int> errors;  // what each bind gives, the last one for good
    const char* line;         // null: bound in the end
};

std::vector<int> g_refusals;
int refusingOpener(int) {
    int err = g_refusals.size() > 1 ? g_refusals.front() : g_refusals.back();
    if (g_refusals.size() > 1) g_refusals.erase(g_refusals.begin());
    if (err == 0) return socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0);
    return errno = err, -1;
}

TEST(HciUserTest, EachBindRefusalSaysWhatToDo) {
    const BindRefusal kRefusals[] = {
            {{EAFNOSUPPORT}, "this kernel has no Bluetooth (no AF_BLUETOOTH sockets): load its module with modprobe "
                             "bluetooth, or use a kernel built with Bluetooth"},
            {{EPERM}, "no permission: the HCI user channel needs CAP_NET_ADMIN; run as root, e.g. with sudo (a file "
                      "capability on java does not work: its launcher then fails to find its own libraries)"},
            {{EBUSY}, "the adapter is up or in use, for example by the system's Bluetooth service: bring it down, e.g. "
                      "btmgmt --index 7 power off, or stop the service (systemctl stop bluetooth)"},
            {{ENODEV}, "there is no adapter hci7; the kernel knows no Bluetooth adapter here"},
            {{EINVAL}, "the kernel refused adapter index 7 (Invalid argument)"},
            {{EBUSY, EBUSY, 0}, nullptr},  // the kernel's own setup of a new adapter, waited out
    };
    LogCapture log;
    hci_user_use_opener(refusingOpener);
    for (const BindRefusal& r : kRefusals) {
        g_refusals = r.errors;
        log.clear();
        sp<IBluetoothHci> hci = serviceFor("hci:7");
        sp<RecordingCallbacks> callbacks = new RecordingCallbacks();
        hci->initialize(callbacks);
        HciStatus status;
        ASSERT_TRUE(callbacks->waitForInit(&status));
        EXPECT_EQ(r.line == nullptr ? HciStatus::SUCCESS : HciStatus::INITIALIZATION_ERROR, status);
        if (r.line != nullptr) {
            EXPECT_TRUE(log.contains(ANDROID_LOG_ERROR, std::string("h4: cannot take hci:7: ") + r.line)) << r.line;
        }
        hci->close().isOk();
    }
    hci_user_lost(7);
    hci_user_use_opener(nullptr);
    unsetenv("HALVENOR_HCI");
}

}  // namespace
