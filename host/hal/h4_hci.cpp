// IBluetoothHci over H4 on a stream. The reader thread connects (bounded),
// answers initializationComplete once, then reassembles the controller's
// stream into callbacks until close, end of stream or a bad type byte.
#include "host/hal/h4_hci.h"

#include <errno.h>
#include <fcntl.h>
#include <netdb.h>
#include <netinet/in.h>
#include <netinet/tcp.h>
#include <poll.h>
#include <string.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <termios.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstdlib>
#include <memory>
#include <mutex>
#include <thread>

#include "host/hal/btsnoop.h"
#include "host/hal/h4_io.h"
#include "host/hal/h4_stream.h"
#include "host/hal/host_hci.h"
#include "host/hal/host_log.h"

// A controller that has not answered a connect by then is not coming.
static const int kConnectTimeoutMs = 3000;

struct BaudRow {
    int baud;
    speed_t speed;
};
static const BaudRow kBauds[] = {
        {9600, B9600},       {19200, B19200},     {38400, B38400},     {57600, B57600},
        {115200, B115200},   {230400, B230400},   {460800, B460800},   {500000, B500000},
        {921600, B921600},   {1000000, B1000000}, {1500000, B1500000}, {2000000, B2000000},
        {3000000, B3000000}, {4000000, B4000000}, {0, B0},
};

static bool baud_speed(int baud, speed_t* speed) {
    for (const BaudRow* row = kBauds; row->baud != 0; ++row) {
        if (row->baud == baud) {
            *speed = row->speed;
            return true;
        }
    }
    return false;
}

// A whole decimal number in 1..max, else -1.
static long parse_number(const std::string& text, long max) {
    if (text.empty() || text.find_first_not_of("0123456789") != std::string::npos) return -1;
    if (text.size() > 9) return -1;
    long n = strtol(text.c_str(), nullptr, 10);
    return n >= 1 && n <= max ? n : -1;
}

// "DEVICE[,BAUD][,rtscts]": many UART boards need RTS/CTS to keep up.
static bool parse_tty(const std::string& rest, H4Target* t, std::string* why) {
    size_t comma = rest.find(',');
    t->path = rest.substr(0, comma);
    if (t->path.empty()) return *why = "no device after tty:", false;
    while (comma != std::string::npos) {
        size_t next = rest.find(',', comma + 1);
        std::string field = rest.substr(comma + 1, next == std::string::npos ? std::string::npos : next - comma - 1);
        comma = next;
        if (field == "rtscts") {
            t->rtscts = true;
            continue;
        }
        long baud = parse_number(field, 4000000);
        speed_t speed;
        if (baud < 0 || !baud_speed(static_cast<int>(baud), &speed)) {
            return *why = "baud rate " + field + " is not a standard speed (9600 to 4000000)", false;
        }
        t->baud = static_cast<int>(baud);
    }
    return true;
}

static bool parse_tcp(const std::string& rest, H4Target* t, std::string* why) {
    size_t colon = rest.rfind(':');
    if (colon == std::string::npos || colon == 0) return *why = "expected tcp:HOST:PORT", false;
    t->path = rest.substr(0, colon);
    long port = parse_number(rest.substr(colon + 1), 65535);
    if (port < 0) return *why = "port '" + rest.substr(colon + 1) + "' is not in 1..65535", false;
    t->port = static_cast<int>(port);
    return true;
}

bool parse_h4_target(const std::string& value, H4Target* t, std::string* why) {
    t->text = value;
    size_t colon = value.find(':');
    std::string kind = value.substr(0, colon);
    std::string rest = colon == std::string::npos ? "" : value.substr(colon + 1);
    if (colon != std::string::npos && kind == "unix") {
        t->kind = H4Target::UNIX;
        t->path = rest;
        if (rest.empty()) return *why = "no path after unix:", false;
        if (rest.size() >= sizeof(sockaddr_un::sun_path)) return *why = "socket path too long", false;
        return true;
    }
    if (colon != std::string::npos && kind == "tcp") {
        t->kind = H4Target::TCP;
        return parse_tcp(rest, t, why);
    }
    if (colon != std::string::npos && kind == "tty") {
        t->kind = H4Target::TTY;
        return parse_tty(rest, t, why);
    }
    *why = "expected sim, none, unix:PATH, tcp:HOST:PORT or tty:DEVICE[,BAUD][,rtscts]";
    return false;
}

// Waits for `events` on fd or for the wake descriptor; false on time-out,
// wake-up or error (with *why set).
static bool wait_for(int fd, short events, int wake, int timeout_ms, std::string* why) {
    struct pollfd pfds[2] = {{fd, events, 0}, {wake, POLLIN, 0}};
    int rc;
    while ((rc = poll(pfds, 2, timeout_ms)) == -1 && errno == EINTR) {
    }
    if (rc == 0) return *why = "no answer within " + std::to_string(timeout_ms) + " ms", false;
    if (rc < 0) return *why = std::string("poll: ") + strerror(errno), false;
    if (pfds[1].revents != 0) return *why = "closed while connecting", false;
    return true;
}

// Non-blocking connect bounded by the time-out, then back to blocking I/O.
static int connect_bounded(int fd, const sockaddr* addr, socklen_t len, int wake, std::string* why) {
    fcntl(fd, F_SETFL, fcntl(fd, F_GETFL) | O_NONBLOCK);
    if (connect(fd, addr, len) == -1) {
        if (errno != EINPROGRESS) return *why = std::string("connect: ") + strerror(errno), -1;
        if (!wait_for(fd, POLLOUT, wake, kConnectTimeoutMs, why)) return -1;
        int err = 0;
        socklen_t err_len = sizeof(err);
        getsockopt(fd, SOL_SOCKET, SO_ERROR, &err, &err_len);
        if (err != 0) return *why = std::string("connect: ") + strerror(err), -1;
    }
    fcntl(fd, F_SETFL, fcntl(fd, F_GETFL) & ~O_NONBLOCK);
    return fd;
}

static int connect_unix(const H4Target& t, int wake, std::string* why) {
    int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (fd == -1) return *why = std::string("socket: ") + strerror(errno), -1;
    struct sockaddr_un addr = {};
    addr.sun_family = AF_UNIX;
    memcpy(addr.sun_path, t.path.c_str(), t.path.size());
    if (connect_bounded(fd, reinterpret_cast<sockaddr*>(&addr), sizeof(addr), wake, why) == -1) {
        close(fd);
        return -1;
    }
    return fd;
}

static int connect_tcp(const H4Target& t, int wake, std::string* why) {
    struct addrinfo hints = {};
    hints.ai_family = AF_UNSPEC;
    hints.ai_socktype = SOCK_STREAM;
    hints.ai_flags = AI_NUMERICSERV;
    struct addrinfo* found = nullptr;
    int rc = getaddrinfo(t.path.c_str(), std::to_string(t.port).c_str(), &hints, &found);
    if (rc != 0) return *why = std::string("host: ") + gai_strerror(rc), -1;
    int fd = -1;
    for (struct addrinfo* ai = found; ai != nullptr && fd == -1; ai = ai->ai_next) {
        fd = socket(ai->ai_family, ai->ai_socktype | SOCK_CLOEXEC, ai->ai_protocol);
        if (fd == -1) continue;
        if (connect_bounded(fd, ai->ai_addr, ai->ai_addrlen, wake, why) == -1) {
            close(fd);
            fd = -1;
        }
    }
    freeaddrinfo(found);
    if (fd == -1) return -1;
    int one = 1;
    setsockopt(fd, IPPROTO_TCP, TCP_NODELAY, &one, sizeof(one));  // commands are tiny
    return fd;
}

// Raw 8N1 at the requested speed, with RTS/CTS only when asked for.
static int open_tty(const H4Target& t, std::string* why) {
    int fd = open(t.path.c_str(), O_RDWR | O_NOCTTY | O_NONBLOCK | O_CLOEXEC);
    if (fd == -1) return *why = std::string("open: ") + strerror(errno), -1;
    struct termios tio;
    speed_t speed = B115200;
    baud_speed(t.baud, &speed);
    if (tcgetattr(fd, &tio) == -1) {
        *why = errno == ENOTTY ? std::string("not a serial line") : std::string("tcgetattr: ") + strerror(errno);
        close(fd);
        return -1;
    }
    cfmakeraw(&tio);
    tio.c_cflag |= CLOCAL | CREAD;
    if (t.rtscts) tio.c_cflag |= CRTSCTS;
    else tio.c_cflag &= ~CRTSCTS;
    cfsetispeed(&tio, speed);
    cfsetospeed(&tio, speed);
    if (tcsetattr(fd, TCSANOW, &tio) == -1) {
        *why = std::string("tcsetattr: ") + strerror(errno);
        close(fd);
        return -1;
    }
    tcflush(fd, TCIFLUSH);
    fcntl(fd, F_SETFL, fcntl(fd, F_GETFL) & ~O_NONBLOCK);
    return fd;
}

static int connect_target(const H4Target& t, int wake, std::string* why) {
    switch (t.kind) {
        case H4Target::UNIX: return connect_unix(t, wake, why);
        case H4Target::TCP: return connect_tcp(t, wake, why);
        case H4Target::TTY: return open_tty(t, why);
    }
    return -1;
}

namespace {

class H4Hci final : public HostHci {
  public:
    explicit H4Hci(H4Target target) : target_(std::move(target)) {}
    ~H4Hci() override { stop(); }

    Return<void> initialize(const sp<IBluetoothHciCallbacks>& callback) override;

  private:
    bool isSocket() const { return target_.kind != H4Target::TTY; }
    void readerMain();
    void readLoop(int fd);
    void deliver(const H4Packet& packet);
    void endSession(int fd);
    Return<void> send(uint8_t type, const hidl_vec<uint8_t>& packet) override;
    void stop() override;

    const H4Target target_;
    sp<IBluetoothHciCallbacks> callbacks_;  // set before the reader starts, cleared after it ends
    int wake_ = -1;                         // eventfd: close() wakes the reader
    std::atomic<bool> closing_{false};      // the end of stream ahead is close()'s own
    std::thread reader_;
    std::mutex write_lock_;  // one packet at a time on the stream
    std::mutex lock_;        // guards the fields below
    int fd_ = -1;
    bool connected_ = false;
    bool drop_logged_ = false;
    std::shared_ptr<Btsnoop> snoop_;
};

Return<void> H4Hci::initialize(const sp<IBluetoothHciCallbacks>& callback) {
    stop();  // a second initialize starts a fresh session
    wake_ = eventfd(0, EFD_CLOEXEC);
    if (wake_ == -1) {
        HLOGE("h4: eventfd: %s", strerror(errno));
        callback->initializationComplete(Status::INITIALIZATION_ERROR);
        return Void();
    }
    callbacks_ = callback;
    {
        std::lock_guard<std::mutex> guard(lock_);
        snoop_ = Btsnoop::fromEnvironment();
        drop_logged_ = false;
    }
    reader_ = std::thread(&H4Hci::readerMain, this);
    return Void();
}

void H4Hci::readerMain() {
    std::string why;
    int fd = connect_target(target_, wake_, &why);
    if (fd == -1) {
        HLOGE("h4: cannot reach %s: %s", target_.text.c_str(), why.c_str());
        callbacks_->initializationComplete(Status::INITIALIZATION_ERROR);
        return;
    }
    {
        std::lock_guard<std::mutex> guard(lock_);
        fd_ = fd;
        connected_ = true;
    }
    HLOGI("h4: connected to %s", target_.text.c_str());
    callbacks_->initializationComplete(Status::SUCCESS);
    readLoop(fd);
}

// The controller is gone: the session ends on its side and the service dies.
void H4Hci::endSession(int fd) {
    {
        std::lock_guard<std::mutex> guard(lock_);
        connected_ = false;
        if (isSocket()) shutdown(fd, SHUT_RDWR);
    }
    die();
}

void H4Hci::readLoop(int fd) {
    H4Stream stream;
    uint8_t buf[4096];
    auto sink = [this](const H4Packet& packet) { deliver(packet); };
    std::string why;
    while (wait_for(fd, POLLIN, wake_, -1, &why)) {
        ssize_t n = read(fd, buf, sizeof(buf));
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0 && closing_.load()) return;
        if (n <= 0) {
            if (n == 0) {
                HLOGE("h4: %s: controller closed the connection%s", target_.text.c_str(),
                      stream.pending() ? " in the middle of a packet" : "");
            } else {
                HLOGE("h4: %s: connection lost: %s", target_.text.c_str(), strerror(errno));
            }
            return endSession(fd);
        }
        if (!stream.feed(buf, static_cast<size_t>(n), sink)) {
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
    hidl_vec<uint8_t> bytes;
    bytes.setToExternal(const_cast<uint8_t*>(packet.bytes.data()), packet.bytes.size());
    switch (packet.type) {
        case H4_TYPE_EVENT: callbacks_->hciEventReceived(bytes); break;
        case H4_TYPE_ACL: callbacks_->aclDataReceived(bytes); break;
        case H4_TYPE_SCO: callbacks_->scoDataReceived(bytes); break;
        default: HLOGE("h4: command packet from the controller %s dropped", target_.text.c_str());
    }
}

Return<void> H4Hci::send(uint8_t type, const hidl_vec<uint8_t>& packet) {
    std::lock_guard<std::mutex> writing(write_lock_);
    int fd;
    std::shared_ptr<Btsnoop> snoop;
    {
        std::lock_guard<std::mutex> guard(lock_);
        if (hasDied()) return deadObject();
        if (!connected_) {
            if (!drop_logged_) HLOGE("h4: not connected to %s, packets dropped", target_.text.c_str());
            drop_logged_ = true;
            return Void();
        }
        fd = fd_;
        snoop = snoop_;
    }
    // Captured before the write: the controller's answer may be read, and
    // captured, before a write returns.
    if (snoop) snoop->record(type, packet.data(), packet.size(), false);
    if (!h4_send(fd, type, packet.data(), packet.size(), -1)) {
        HLOGE("h4: %s: connection lost: %s", target_.text.c_str(), strerror(errno));
        endSession(fd);
        return deadObject();
    }
    return Void();
}

// Wakes the reader (and, on a socket, a blocked writer), joins it, and only
// then gives the descriptors back.
void H4Hci::stop() {
    closing_.store(true);
    {
        std::lock_guard<std::mutex> guard(lock_);
        connected_ = false;
        if (fd_ != -1 && isSocket()) shutdown(fd_, SHUT_RDWR);
    }
    if (wake_ != -1) {
        uint64_t one = 1;
        ssize_t ignored = write(wake_, &one, sizeof(one));
        (void)ignored;
    }
    if (reader_.joinable()) reader_.join();
    std::lock_guard<std::mutex> writing(write_lock_);
    std::lock_guard<std::mutex> guard(lock_);
    if (fd_ != -1) ::close(fd_);
    fd_ = -1;
    if (wake_ != -1) ::close(wake_);
    wake_ = -1;
    callbacks_.clear();
    snoop_.reset();
    closing_.store(false);
}

}  // namespace

sp<IBluetoothHci> create_h4_hci(const H4Target& target) { return new H4Hci(target); }
