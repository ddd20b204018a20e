// halvenor-sim's serving: accepts on the listener, and gives every connection
// a thread with its own SimController on the one shared air; stopping shuts
// the connections down and joins their threads.
#include "host/sim-server/sim_server.h"

#include <arpa/inet.h>
#include <errno.h>
#include <fcntl.h>
#include <netinet/in.h>
#include <netinet/tcp.h>
#include <poll.h>
#include <string.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <atomic>
#include <memory>
#include <mutex>
#include <thread>
#include <vector>

#include "host/hal/h4_io.h"
#include "host/hal/h4_stream.h"
#include "host/hal/host_log.h"

// A socket left by a run that ended can be taken over; one that something
// still answers on, or a file that is no socket, cannot.
static bool path_free(const std::string& path, const sockaddr_un& addr, std::string* why) {
    struct stat st;
    if (lstat(path.c_str(), &st) == -1) return true;
    if (!S_ISSOCK(st.st_mode)) return *why = "cannot listen on " + path + ": it exists and is not a socket", false;
    int probe = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    bool served = probe != -1 && connect(probe, reinterpret_cast<const sockaddr*>(&addr), sizeof(addr)) == 0;
    if (probe != -1) close(probe);
    if (served) return *why = "cannot listen on " + path + ": another process serves it", false;
    unlink(path.c_str());
    return true;
}

static int listen_unix(const std::string& path, std::string* where, std::string* why) {
    struct sockaddr_un addr = {};
    if (path.size() >= sizeof(addr.sun_path)) return *why = "socket path too long: " + path, -1;
    addr.sun_family = AF_UNIX;
    memcpy(addr.sun_path, path.c_str(), path.size());
    if (!path_free(path, addr, why)) return -1;
    int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (fd == -1 || bind(fd, reinterpret_cast<sockaddr*>(&addr), sizeof(addr)) == -1 || listen(fd, 8) == -1) {
        *why = "cannot listen on " + path + ": " + strerror(errno);
        if (fd != -1) close(fd);
        return -1;
    }
    *where = "unix:" + path;
    return fd;
}

static int listen_tcp(int port, std::string* where, std::string* why) {
    int fd = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    int one = 1;
    if (fd != -1) setsockopt(fd, SOL_SOCKET, SO_REUSEADDR, &one, sizeof(one));
    struct sockaddr_in addr = {};
    addr.sin_family = AF_INET;
    addr.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    addr.sin_port = htons(static_cast<uint16_t>(port));
    socklen_t len = sizeof(addr);
    if (fd == -1 || bind(fd, reinterpret_cast<sockaddr*>(&addr), len) == -1 || listen(fd, 8) == -1 ||
        getsockname(fd, reinterpret_cast<sockaddr*>(&addr), &len) == -1) {
        *why = "cannot listen on 127.0.0.1:" + std::to_string(port) + ": " + strerror(errno);
        if (fd != -1) close(fd);
        return -1;
    }
    *where = "tcp:127.0.0.1:" + std::to_string(ntohs(addr.sin_port));
    return fd;
}

int sim_server_listen(const SimServerOptions& options, std::string* where, std::string* why) {
    if (!options.unix_path.empty()) return listen_unix(options.unix_path, where, why);
    return listen_tcp(options.tcp_port, where, why);
}

// One connection: commands in, the controller's events out, in order, until
// its end or until stop_fd (-1: none) becomes readable.
static void serve_connection(int fd, int stop_fd, SimAir* air, SimControllerSettings settings) {
    SimController controller(*air, settings);
    H4Stream stream;
    uint8_t buf[4096];
    bool writable = true;
    auto sink = [&](const H4Packet& packet) {
        if (packet.type != H4_TYPE_COMMAND) return;  // no data in the test modes
        for (const auto& event : controller.command(packet.bytes.data(), packet.bytes.size())) {
            if (writable && !h4_send(fd, H4_TYPE_EVENT, event.data(), event.size(), -1)) writable = false;
        }
    };
    for (;;) {
        struct pollfd pfds[2] = {{fd, POLLIN, 0}, {stop_fd, POLLIN, 0}};
        if (poll(pfds, 2, -1) == -1 && errno != EINTR) break;
        if (pfds[1].revents != 0) break;
        if (pfds[0].revents == 0) continue;
        ssize_t n = read(fd, buf, sizeof(buf));
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0 || !writable) break;
        if (!stream.feed(buf, static_cast<size_t>(n), sink)) {
            HLOGE("halvenor-sim: unknown packet type 0x%02x, connection closed", stream.badType());
            break;
        }
    }
    // The controller ends its tests as it goes, so a vanished tester stops transmitting.
}

struct Connection {
    int fd;
    std::atomic<bool> done{false};
    std::thread thread;
};

// Gives back the descriptors and threads of connections that have ended.
static void reap_connections(std::vector<std::unique_ptr<Connection>>& connections) {
    for (auto it = connections.begin(); it != connections.end();) {
        if (!(*it)->done.load()) {
            ++it;
            continue;
        }
        (*it)->thread.join();
        close((*it)->fd);
        it = connections.erase(it);
    }
}

static void stop_connections(std::vector<std::unique_ptr<Connection>>& connections) {
    for (auto& c : connections) shutdown(c->fd, SHUT_RDWR);
    for (auto& c : connections) {
        c->thread.join();
        close(c->fd);
    }
    connections.clear();
}

void sim_server_run(int listen_fd, int stop_fd, const SimControllerSettings& settings) {
    SimAir air;
    std::vector<std::unique_ptr<Connection>> connections;
    for (;;) {
        struct pollfd pfds[2] = {{listen_fd, POLLIN, 0}, {stop_fd, POLLIN, 0}};
        if (poll(pfds, 2, -1) == -1) {
            if (errno == EINTR) continue;
            HLOGE("halvenor-sim: poll: %s", strerror(errno));
            break;
        }
        if (pfds[1].revents != 0) break;
        int fd = accept4(listen_fd, nullptr, nullptr, SOCK_CLOEXEC);
        if (fd == -1) continue;
        int one = 1;
        setsockopt(fd, IPPROTO_TCP, TCP_NODELAY, &one, sizeof(one));  // fails harmlessly on unix sockets
        auto c = std::make_unique<Connection>();
        c->fd = fd;
        Connection* raw = c.get();
        c->thread = std::thread([raw, &air, settings] {
            serve_connection(raw->fd, -1, &air, settings);
            raw->done.store(true);
        });
        reap_connections(connections);
        connections.push_back(std::move(c));
    }
    stop_connections(connections);
}

// The kernel answers a create request with the new adapter's index.
static bool read_vhci_index(int fd, int* index, std::string* why) {
    struct pollfd pfd = {fd, POLLIN, 0};
    uint8_t reply[4];
    if (poll(&pfd, 1, 2000) != 1) return *why = "the kernel did not answer the create request within 2 s", false;
    ssize_t n = read(fd, reply, sizeof(reply));
    if (n != 4 || reply[0] != 0xff || reply[1] != 0x80) return *why = "the kernel's answer to the create request is not one", false;
    *index = reply[2] | reply[3] << 8;
    return true;
}

int sim_server_vhci(const std::string& device, std::string* where, std::string* why) {
    int fd = open(device.c_str(), O_RDWR | O_CLOEXEC);
    if (fd == -1) {
        int err = errno;
        *why = "cannot open " + device + ": " + strerror(err) +
               (err == ENOENT ? " (load the driver: modprobe hci_vhci)" : err == EACCES ? " (run as root)" : "");
        return -1;
    }
    // 0x80: a raw adapter, which the kernel leaves to whoever takes its user channel.
    const uint8_t create[] = {0xff, 0x80};
    int index = 0;
    if (write(fd, create, sizeof(create)) != sizeof(create)) {
        *why = "create request to " + device + ": " + strerror(errno);
    } else if (read_vhci_index(fd, &index, why)) {
        *where = "hci:" + std::to_string(index);
        return fd;
    }
    close(fd);
    return -1;
}

void sim_server_serve(int fd, int stop_fd, const SimControllerSettings& settings) {
    SimAir air;
    serve_connection(fd, stop_fd, &air, settings);
}
