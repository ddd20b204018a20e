// Helpers for the host HAL suites: a recording IBluetoothHciCallbacks, the
// service behind getService("default") for a HALVENOR_HCI value, child
// processes (btvirt, halvenor-sim) that die with the test, temp paths.
#pragma once

#include <sys/types.h>

#include <condition_variable>
#include <cstdint>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include <android/hardware/bluetooth/1.0/IBluetoothHci.h>

using Bytes = std::vector<uint8_t>;
using HciStatus = android::hardware::bluetooth::V1_0::Status;

struct Received {
    uint8_t type;  // 2 ACL, 3 SCO, 4 event
    Bytes bytes;
};

class RecordingCallbacks : public android::hardware::bluetooth::V1_0::IBluetoothHciCallbacks {
  public:
    template <typename T>
    using Return = android::hardware::Return<T>;
    using hidl_bytes = android::hardware::hidl_vec<uint8_t>;

    Return<void> initializationComplete(HciStatus status) override;
    Return<void> hciEventReceived(const hidl_bytes& event) override { return record(4, event); }
    Return<void> aclDataReceived(const hidl_bytes& data) override { return record(2, data); }
    Return<void> scoDataReceived(const hidl_bytes& data) override { return record(3, data); }

    // Waits (bounded) for the first initializationComplete; false if none came.
    bool waitForInit(HciStatus* status, int timeout_ms = 10000);
    bool waitForPackets(size_t count, int timeout_ms = 5000);
    std::vector<Received> packets();
    int initCount();
    // Threads that ran any callback.
    std::vector<std::thread::id> callbackThreads();

  private:
    Return<void> record(uint8_t type, const hidl_bytes& bytes);
    std::mutex lock_;
    std::condition_variable changed_;
    std::vector<HciStatus> inits_;
    std::vector<Received> packets_;
    std::vector<std::thread::id> threads_;
};

// Sets HALVENOR_HCI (unset for nullptr) and asks the registry for "default".
android::sp<android::hardware::bluetooth::V1_0::IBluetoothHci> serviceFor(const char* hci);

// A service from serviceFor, initialised, with the callbacks it reports to.
struct StartedHci {
    android::sp<android::hardware::bluetooth::V1_0::IBluetoothHci> hci;
    android::sp<RecordingCallbacks> callbacks;
};
// serviceFor(hci), initialised; a missing or failed initialisation fails the test.
StartedHci startHci(const char* hci);
// Sends a command and returns the packet that answers it, empty on time-out.
Bytes commandEvent(const StartedHci& started, const Bytes& command);

// The monotonic clock in microseconds, the same in every process.
int64_t steadyUs();

struct Child {
    pid_t pid = -1;
    int out = -1;  // the child's stdout, when captured
    int in = -1;   // the child's stdin, when asked for
};
// Starts argv[0] with its stdout on a pipe (and its stdin on another when
// with_stdin); the child gets SIGKILL if the test dies.
Child spawnChild(const std::vector<std::string>& argv, bool with_stdin = false);
// SIGTERM, then SIGKILL if it has not ended within a second; reaps it.
void stopChild(Child& child);
// One line of the child's stdout, waiting at most timeout_ms.
std::string readLine(int fd, int timeout_ms = 5000);

// A fresh path under the test's temp directory (nothing created there).
std::string tempPath(const std::string& name);
// H4 bytes of a packet: type byte then the packet.
Bytes h4(uint8_t type, const Bytes& packet);

// Library side: reads one H4 event from the tool end (type, code, length,
// parameters), bounded; empty on time-out or a packet that is not an event.
Bytes readEvent(int fd, int timeout_ms = 5000);
// Writes an H4 command to the tool end and reads the one event answering it.
Bytes exchange(int fd, const Bytes& command);
// Num_Packets of an LE Test End Command Complete as read by readEvent, or -1.
int testEndCount(const Bytes& event);
