// Helpers for the host HAL suites; see the header.
#include "tests/host/host_test_support.h"

#include "tests/support/process.h"

#include <gtest/gtest.h>

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <stdlib.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>

using android::sp;
using android::hardware::Void;
using android::hardware::bluetooth::V1_0::IBluetoothHci;

RecordingCallbacks::Return<void> RecordingCallbacks::initializationComplete(HciStatus status) {
    std::lock_guard<std::mutex> guard(lock_);
    inits_.push_back(status);
    threads_.push_back(std::this_thread::get_id());
    changed_.notify_all();
    return Void();
}

RecordingCallbacks::Return<void> RecordingCallbacks::record(uint8_t type, const hidl_bytes& bytes) {
    std::lock_guard<std::mutex> guard(lock_);
    packets_.push_back({type, Bytes(bytes.begin(), bytes.end())});
    threads_.push_back(std::this_thread::get_id());
    changed_.notify_all();
    return Void();
}

bool RecordingCallbacks::waitForInit(HciStatus* status, int timeout_ms) {
    std::unique_lock<std::mutex> guard(lock_);
    if (!changed_.wait_for(guard, std::chrono::milliseconds(timeout_ms), [&] { return !inits_.empty(); })) {
        return false;
    }
    *status = inits_.front();
    return true;
}

bool RecordingCallbacks::waitForPackets(size_t count, int timeout_ms) {
    std::unique_lock<std::mutex> guard(lock_);
    return changed_.wait_for(guard, std::chrono::milliseconds(timeout_ms),
                             [&] { return packets_.size() >= count; });
}

std::vector<Received> RecordingCallbacks::packets() {
    std::lock_guard<std::mutex> guard(lock_);
    return packets_;
}

int RecordingCallbacks::initCount() {
    std::lock_guard<std::mutex> guard(lock_);
    return static_cast<int>(inits_.size());
}

std::vector<std::thread::id> RecordingCallbacks::callbackThreads() {
    std::lock_guard<std::mutex> guard(lock_);
    return threads_;
}

sp<IBluetoothHci> serviceFor(const char* hci) {
    if (hci == nullptr) {
        unsetenv("HALVENOR_HCI");
    } else {
        setenv("HALVENOR_HCI", hci, 1);
    }
    return IBluetoothHci::getService("default");
}

StartedHci startHci(const char* hci) {
    StartedHci started{serviceFor(hci), new RecordingCallbacks()};
    EXPECT_NE(nullptr, started.hci.get()) << (hci != nullptr ? hci : "(unset)");
    if (started.hci == nullptr) return started;
    started.hci->initialize(started.callbacks);
    HciStatus status = HciStatus::UNKNOWN;
    EXPECT_TRUE(started.callbacks->waitForInit(&status));
    EXPECT_EQ(HciStatus::SUCCESS, status);
    return started;
}

Bytes commandEvent(const StartedHci& started, const Bytes& command) {
    size_t before = started.callbacks->packets().size();
    started.hci->sendHciCommand(command);
    if (!started.callbacks->waitForPackets(before + 1)) return {};
    return started.callbacks->packets()[before].bytes;
}

int64_t steadyUs() {
    return std::chrono::duration_cast<std::chrono::microseconds>(
                   std::chrono::steady_clock::now().time_since_epoch())
            .count();
}

Child spawnChild(const std::vector<std::string>& argv, bool with_stdin) {
    int fds[2];
    int in[2] = {-1, -1};
    Child child;
    if (pipe2(fds, O_CLOEXEC) == -1) return child;
    if (with_stdin && pipe2(in, O_CLOEXEC) == -1) {
        close(fds[0]);
        close(fds[1]);
        return child;
    }
    pid_t parent = getpid();
    child.pid = fork();
    if (child.pid == 0) {
        prctl(PR_SET_PDEATHSIG, SIGKILL);
        if (getppid() != parent) _exit(127);
        dup2(fds[1], STDOUT_FILENO);
        if (with_stdin) dup2(in[0], STDIN_FILENO);
        std::vector<char*> args;
        for (const auto& a : argv) args.push_back(const_cast<char*>(a.c_str()));
        args.push_back(nullptr);
        execvp(args[0], args.data());
        _exit(127);
    }
    close(fds[1]);
    child.out = fds[0];
    if (with_stdin) {
        close(in[0]);
        child.in = in[1];
    }
    return child;
}

void stopChild(Child& child) {
    if (child.pid > 0) {
        kill(child.pid, SIGTERM);
        int status;
        auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(1);
        while (waitpid(child.pid, &status, WNOHANG) == 0) {
            if (std::chrono::steady_clock::now() > deadline) {
                kill(child.pid, SIGKILL);
                waitpid(child.pid, &status, 0);
                break;
            }
            std::this_thread::sleep_for(std::chrono::milliseconds(5));
        }
    }
    if (child.out != -1) close(child.out);
    if (child.in != -1) close(child.in);
    child = Child();
}

std::string readLine(int fd, int timeout_ms) {
    std::string line;
    auto deadline = std::chrono::steady_clock::now() + std::chrono::milliseconds(timeout_ms);
    for (;;) {
        auto left = std::chrono::duration_cast<std::chrono::milliseconds>(
                deadline - std::chrono::steady_clock::now()).count();
        struct pollfd pfd = {fd, POLLIN, 0};
        if (left <= 0 || poll(&pfd, 1, static_cast<int>(left)) <= 0) return line;
        char c;
        if (read(fd, &c, 1) != 1 || c == '\n') return line;
        line += c;
    }
}

std::string tempPath(const std::string& name) {
    const char* dir = getenv("TMPDIR");
    return std::string(dir != nullptr ? dir : "/tmp") + "/halvenor-" + std::to_string(getpid()) + "-" + name;
}

Bytes h4(uint8_t type, const Bytes& packet) {
    Bytes out(packet.size() + 1);
    out[0] = type;
    std::copy(packet.begin(), packet.end(), out.begin() + 1);
    return out;
}

Bytes readEvent(int fd, int timeout_ms) {
    Bytes header = readBytes(fd, 3, timeout_ms);
    if (header.size() != 3 || header[0] != 4) return {};
    Bytes params = readBytes(fd, header[2], timeout_ms);
    if (params.size() != header[2]) return {};
    header.insert(header.end(), params.begin(), params.end());
    return header;
}

Bytes exchange(int fd, const Bytes& command) {
    writeAll(fd, h4(1, command));
    return readEvent(fd);
}

int testEndCount(const Bytes& event) {
    // 04 0E 06 01 1F 20 status count-low count-high
    if (event.size() != 9 || event[1] != 0x0E || event[4] != 0x1F || event[5] != 0x20) return -1;
    return event[7] | (event[8] << 8);
}
