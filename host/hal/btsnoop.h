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
    // The captures named by HALVENOR_BTSNOOP (the user's) and
    // HALVENOR_CONSOLE_CAPTURE (the console's own, where it reads the
    // controller's answers), or null when neither is set or none can be
    // opened (logged).
    static std::shared_ptr<Btsnoop> fromEnvironment();
    // Appends to path, writing the file header first when the file is new or empty.
    static std::shared_ptr<Btsnoop> open(const std::string& path);
    ~Btsnoop();

    // One H4 packet: type byte and HCI packet. received: controller to host.
    void record(uint8_t type, const uint8_t* packet, size_t len, bool received);

  private:
    explicit Btsnoop(std::vector<int> fds) : fds_(std::move(fds)) {}
    static int openFile(const std::string& path);
    std::vector<int> fds_;
    std::mutex lock_;
};
