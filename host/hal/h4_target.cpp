// Where an H4 controller is and how to reach it: the unix:, tcp:, tty: and
// hci: values of HALVENOR_HCI, and opening a descriptor to the controller (a
// bounded connect and name resolution, a raw serial line, a user channel). Runs on the
// service's reader thread; the resolver may finish on a thread of its own.
#include "host/hal/h4_target.h"

#include <errno.h>
#include <fcntl.h>
#include <netdb.h>
#include <netinet/in.h>
#include <netinet/tcp.h>
#include <poll.h>
#include <string.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <termios.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdlib>
#include <memory>
#include <mutex>
#include <thread>

#include "host/hal/hci_user.h"

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

// A whole decimal number in min..max, else -1.
static long parse_number(const std::string& text, long max, long min = 1) {
    if (text.empty() || text.find_first_not_of("0123456789") != std::string::npos) return -1;
    if (text.size() > 9) return -1;
    long n = strtol(text.c_str(), nullptr, 10);
    return n >= min && n <= max ? n : -1;
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
    if (colon != std::string::npos && kind == "hci") {
        t->kind = H4Target::USER;
        // 65535 is the kernel's "no adapter".
        t->port = static_cast<int>(parse_number(rest, 65534, 0));
        if (t->port < 0) return *why = "adapter index '" + rest + "' is not in 0..65534", false;
        return true;
    }
    *why = "expected sim, none, unix:PATH, tcp:HOST:PORT, tty:DEVICE[,BAUD][,rtscts] or hci:N";
    return false;
}

// Waits for `events` on fd or for the wake descriptor; false on time-out,
// wake-up or error (with *why set).
bool h4_wait_for(int fd, short events, int wake, int timeout_ms, std::string* why) {
    struct pollfd pfds[2] = {{fd, events, 0}, {wake, POLLIN, 0}};
    int rc;
    while ((rc = poll(pfds, 2, timeout_ms)) == -1 && errno == EINTR) {
    }
    if (rc == 0) return *why = "no answer within " + std::to_string(timeout_ms) + " ms", false;
    if (rc < 0) return *why = std::string("poll: ") + strerror(errno), false;
    if (pfds[1].revents != 0) return *why = "closed while connecting", false;
    return true;
}

// Non-blocking connect bounded by the time-out; the descriptor stays
// non-blocking, so that no write to a controller can block past its bound.
static int connect_bounded(int fd, const sockaddr* addr, socklen_t len, int wake, std::string* why) {
    fcntl(fd, F_SETFL, fcntl(fd, F_GETFL) | O_NONBLOCK);
    if (connect(fd, addr, len) == -1) {
        if (errno != EINPROGRESS) return *why = std::string("connect: ") + strerror(errno), -1;
        if (!h4_wait_for(fd, POLLOUT, wake, kConnectTimeoutMs, why)) return -1;
        int err = 0;
        socklen_t err_len = sizeof(err);
        getsockopt(fd, SOL_SOCKET, SO_ERROR, &err, &err_len);
        if (err != 0) return *why = std::string("connect: ") + strerror(err), -1;
    }
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

static std::atomic<H4Resolver> resolver{getaddrinfo};

void h4_use_resolver(H4Resolver r) { resolver = r != nullptr ? r : getaddrinfo; }

// What the resolver's thread hands back; whoever lets go of it last frees it.
struct Resolution {
    std::mutex lock;
    std::condition_variable done;
    bool finished = false;
    int rc = 0;
    struct addrinfo* found = nullptr;
    ~Resolution() {
        if (found != nullptr) freeaddrinfo(found);
    }
};

// getaddrinfo has no time-out of its own: a stuck resolver is left to finish
// on its thread, which the connect does not wait for past its bound.
static struct addrinfo* resolve_bounded(const H4Target& t, std::string* why) {
    auto r = std::make_shared<Resolution>();
    std::thread([r, host = t.path, port = std::to_string(t.port), resolve = resolver.load()] {
        struct addrinfo hints = {};
        hints.ai_family = AF_UNSPEC;
        hints.ai_socktype = SOCK_STREAM;
        hints.ai_flags = AI_NUMERICSERV;
        struct addrinfo* found = nullptr;
        int rc = resolve(host.c_str(), port.c_str(), &hints, &found);
        std::lock_guard<std::mutex> guard(r->lock);
        r->rc = rc;
        r->found = found;
        r->finished = true;
        r->done.notify_all();
    }).detach();
    std::unique_lock<std::mutex> guard(r->lock);
    if (!r->done.wait_for(guard, std::chrono::milliseconds(kConnectTimeoutMs), [&] { return r->finished; })) {
        *why = "host: no answer from the name resolver within " + std::to_string(kConnectTimeoutMs) + " ms";
        return nullptr;
    }
    if (r->rc != 0) {
        *why = std::string("host: ") + gai_strerror(r->rc);
        return nullptr;
    }
    struct addrinfo* found = r->found;
    r->found = nullptr;
    return found;
}

static int connect_tcp(const H4Target& t, int wake, std::string* why) {
    struct addrinfo* found = resolve_bounded(t, why);
    if (found == nullptr) return -1;
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

// Raw 8N1 at the requested speed, with RTS/CTS only when asked for; left
// non-blocking, so that a line whose flow control is held cannot block a write.
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
    return fd;
}

int connect_h4_target(const H4Target& t, int wake, std::string* why) {
    switch (t.kind) {
        case H4Target::UNIX: return connect_unix(t, wake, why);
        case H4Target::TCP: return connect_tcp(t, wake, why);
        case H4Target::TTY: return open_tty(t, why);
        case H4Target::USER: return hci_user_take(t.port, wake, why);
    }
    return -1;
}
