// A controller speaking H4 on a stream or an adapter's user channel. The
// reader thread connects (bounded), tells the client once whether it could,
// then reassembles the controller's stream into packets for the client until
// stop, end of stream or a byte that starts no packet.
#include "host/hal/h4_hci.h"

#include <errno.h>
#include <poll.h>
#include <string.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <termios.h>
#include <unistd.h>

#include <atomic>
#include <memory>
#include <mutex>
#include <thread>
#include <vector>

#include "host/hal/btsnoop.h"
#include "host/hal/h4_io.h"
#include "host/hal/h4_stream.h"
#include "host/hal/hci_user.h"
#include "host/hal/host_log.h"

// A controller that takes no byte of a packet for this long is stuck: the
// library's own reply time-out.
static const int kWriteTimeoutMs = 2000;
// A user channel's read returns one whole packet, or loses its rest: room for the largest.
static const size_t kReadBytes = 1 + 4 + 65535;

namespace {

class H4Hci final : public HostController {
  public:
    explicit H4Hci(H4Target target) : target_(std::move(target)) {}
    ~H4Hci() override { stop(); }

    void start(std::shared_ptr<ControllerClient> client) override;
    bool send(uint8_t type, const uint8_t* packet, size_t len) override;
    void stop() override;

  private:
    // A user channel's descriptor shares its socket with the one kept bound,
    // which a shutdown would end too.
    bool shutsDown() const { return target_.kind == H4Target::UNIX || target_.kind == H4Target::TCP; }
    bool isTty() const { return target_.kind == H4Target::TTY; }
    bool isAdapter() const { return target_.kind == H4Target::USER; }
    void readerMain();
    void readLoop(int fd);
    void deliver(const H4Packet& packet);
    void endSession(int fd);
    void logSendFailure(int fd);

    const H4Target target_;
    std::shared_ptr<ControllerClient> client_;  // set before the reader starts, cleared after it ends
    int wake_ = -1;                         // eventfd: close() wakes the reader
    std::atomic<bool> closing_{false};      // the end of stream ahead is close()'s own
    std::thread reader_;
    std::mutex write_lock_;  // one packet at a time on the stream
    std::mutex lock_;        // guards the fields below
    int fd_ = -1;
    bool connected_ = false;
    bool gone_ = false;
    bool drop_logged_ = false;
    std::shared_ptr<Btsnoop> snoop_;
};

void H4Hci::start(std::shared_ptr<ControllerClient> client) {
    stop();  // a second start begins a fresh session
    wake_ = eventfd(0, EFD_CLOEXEC);
    if (wake_ == -1) {
        HLOGE("h4: eventfd: %s", strerror(errno));
        client->initialized(false);
        return;
    }
    client_ = std::move(client);
    {
        std::lock_guard<std::mutex> guard(lock_);
        snoop_ = Btsnoop::fromEnvironment();
        drop_logged_ = false;
        gone_ = false;
    }
    reader_ = std::thread(&H4Hci::readerMain, this);
}

void H4Hci::readerMain() {
    std::string why;
    int fd = connect_h4_target(target_, wake_, &why);
    if (fd == -1) {
        HLOGE("h4: cannot %s %s: %s", isAdapter() ? "take" : "reach", target_.text.c_str(), why.c_str());
        client_->initialized(false);
        return;
    }
    {
        std::lock_guard<std::mutex> guard(lock_);
        fd_ = fd;
        connected_ = true;
    }
    HLOGI("h4: connected to %s", target_.text.c_str());
    client_->initialized(true);
    readLoop(fd);
}

// The controller is gone: the session ends on its side, and the client is
// told once.
void H4Hci::endSession(int fd) {
    bool first;
    {
        std::lock_guard<std::mutex> guard(lock_);
        connected_ = false;
        first = !gone_;
        gone_ = true;
        if (shutsDown()) shutdown(fd, SHUT_RDWR);
    }
    if (isAdapter()) hci_user_lost(target_.port);
    if (first) client_->gone();
}

void H4Hci::readLoop(int fd) {
    H4Stream stream;
    std::vector<uint8_t> buf(kReadBytes);
    auto sink = [this](const H4Packet& packet) { deliver(packet); };
    std::string why;
    while (h4_wait_for(fd, POLLIN, wake_, -1, &why)) {
        ssize_t n = read(fd, buf.data(), buf.size());
        if (n < 0 && (errno == EINTR || errno == EAGAIN)) continue;
        if (n <= 0 && closing_.load()) return;
        if (n <= 0 && isAdapter()) {
            // EPIPE or ENODEV: the kernel removed it, or took it back.
            HLOGE("h4: %s: the adapter went away%s%s", target_.text.c_str(), n == 0 ? "" : ": ",
                  n == 0 ? "" : strerror(errno));
            return endSession(fd);
        }
        if (n <= 0) {
            if (n == 0) {
                HLOGE("h4: %s: controller closed the connection%s", target_.text.c_str(),
                      stream.pending() ? " in the middle of a packet" : "");
            } else {
                HLOGE("h4: %s: connection lost: %s", target_.text.c_str(), strerror(errno));
            }
            return endSession(fd);
        }
        if (!stream.feed(buf.data(), static_cast<size_t>(n), sink)) {
            HLOGE("h4: %s: controller sent unknown packet type 0x%02x, connection closed",
                  target_.text.c_str(), stream.badType());
            return endSession(fd);
        }
    }
}

void H4Hci::deliver(const H4Packet& packet) {
    std::shared_ptr<Btsnoop> snoop;
    {
        std::lock_guard<std::mutex> guard(lock_);
        snoop = snoop_;
    }
    if (snoop) snoop->record(packet.type, packet.bytes.data(), packet.bytes.size(), true);
    client_->received(packet.type, packet.bytes.data(), packet.bytes.size());
}

bool H4Hci::send(uint8_t type, const uint8_t* packet, size_t len) {
    std::lock_guard<std::mutex> writing(write_lock_);
    int fd;
    std::shared_ptr<Btsnoop> snoop;
    {
        std::lock_guard<std::mutex> guard(lock_);
        if (gone_) return false;
        if (!connected_) {
            if (!drop_logged_) HLOGE("h4: not connected to %s, packets dropped", target_.text.c_str());
            drop_logged_ = true;
            return true;
        }
        fd = fd_;
        snoop = snoop_;
    }
    // Captured before the write: the controller's answer may be read, and
    // captured, before a write returns.
    if (snoop) snoop->record(type, packet, len, false);
    if (!h4_send(fd, type, packet, len, kWriteTimeoutMs)) {
        logSendFailure(fd);
        endSession(fd);
        return false;
    }
    return true;
}

// A stuck write leaves its bytes queued: they are thrown away at once, so that
// neither a later write nor closing the line waits for a controller that has
// stopped taking them.
void H4Hci::logSendFailure(int fd) {
    if (errno != ETIMEDOUT) {
        HLOGE("h4: %s: connection lost: %s", target_.text.c_str(), strerror(errno));
        return;
    }
    HLOGE("h4: %s: the controller is not taking bytes (%s for %d s)", target_.text.c_str(),
          isTty() ? "flow control held" : "its connection full", kWriteTimeoutMs / 1000);
    if (isTty()) tcflush(fd, TCOFLUSH);
}

// Wakes the reader (and, on a socket, a blocked writer), joins it, and only
// then gives the descriptors back.
void H4Hci::stop() {
    closing_.store(true);
    {
        std::lock_guard<std::mutex> guard(lock_);
        connected_ = false;
        if (fd_ != -1 && shutsDown()) shutdown(fd_, SHUT_RDWR);
    }
    if (wake_ != -1) {
        uint64_t one = 1;
        ssize_t ignored = write(wake_, &one, sizeof(one));
        (void)ignored;
    }
    if (reader_.joinable()) reader_.join();
    std::lock_guard<std::mutex> writing(write_lock_);
    std::lock_guard<std::mutex> guard(lock_);
    // Output still held by flow control would make close() wait for it.
    if (fd_ != -1 && isTty()) tcflush(fd_, TCOFLUSH);
    if (fd_ != -1) ::close(fd_);
    fd_ = -1;
    if (wake_ != -1) ::close(wake_);
    wake_ = -1;
    client_.reset();
    snoop_.reset();
    closing_.store(false);
}

}  // namespace

std::unique_ptr<HostController> create_h4_hci(const H4Target& target) { return std::make_unique<H4Hci>(target); }
