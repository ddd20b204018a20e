// btsnoop capture (the format of Wireshark and Android's HCI snoop log,
// datalink 1002: H4) of every packet a host backend sends or receives.
// record() may be called from any thread.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

class Btsnoop {
  public:
    // Microseconds since the Unix epoch, as gettimeofday gives them.
    using WallClock = int64_t (*)();

    // The captures named by HALVENOR_BTSNOOP (the user's, stamped with the
    // wall clock) and HALVENOR_CONSOLE_CAPTURE (the console's own, where it
    // reads the controller's answers and times its windows: stamped with the
    // monotonic clock, counted from the wall clock's reading when the process
    // first captured, so a step of the wall clock cannot stretch a window),
    // or null when neither is set or none can be opened (logged).
    static std::shared_ptr<Btsnoop> fromEnvironment();
    // Appends to path, writing the file header first when the file is new or
    // empty; `steady` stamps records as the console's capture is stamped.
    static std::shared_ptr<Btsnoop> open(const std::string& path, bool steady = false);
    // Host tests: the wall clock both kinds of stamp start from.
    static void useWallClock(WallClock clock);
    ~Btsnoop();

    // One H4 packet: type byte and HCI packet. received: controller to host.
    void record(uint8_t type, const uint8_t* packet, size_t len, bool received);

  private:
    struct File {
        int fd;
        bool steady;
    };
    explicit Btsnoop(std::vector<File> files) : files_(std::move(files)) {}
    static int openFile(const std::string& path);
    std::vector<File> files_;
    std::mutex lock_;
};
