// The kernel's HCI user channel (AF_BLUETOOTH, BTPROTO_HCI, HCI_CHANNEL_USER):
// binding it, with the cause and the remedy of each refusal, and keeping it.
#include "host/hal/hci_user.h"

#include <dirent.h>
#include <errno.h>
#include <fcntl.h>
#include <poll.h>
#include <string.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <map>
#include <mutex>
#include <vector>

// The kernel's own sockaddr_hci; BlueZ's headers are not needed for three fields.
struct SockaddrHci {
    sa_family_t hci_family;
    unsigned short hci_dev;
    unsigned short hci_channel;
};
static const int kBtProtoHci = 1;
static const unsigned short kHciChannelUser = 1;

// A newly added adapter is set up by the kernel for up to about 2 s, and
// refuses the channel (EBUSY) meanwhile.
static const int kBusyWaitMs = 2000;
static const int kBusyRetryMs = 100;

static int open_user_channel(int index) {
    int fd = socket(AF_BLUETOOTH, SOCK_RAW | SOCK_CLOEXEC, kBtProtoHci);
    if (fd == -1) return -1;
    SockaddrHci addr = {AF_BLUETOOTH, static_cast<unsigned short>(index), kHciChannelUser};
    if (bind(fd, reinterpret_cast<sockaddr*>(&addr), sizeof(addr)) == -1) {
        int err = errno;
        close(fd);
        errno = err;
        return -1;
    }
    return fd;
}

static std::atomic<HciUserOpener> opener{open_user_channel};

void hci_user_use_opener(HciUserOpener o) { opener = o != nullptr ? o : open_user_channel; }

// The channels taken so far, by adapter index.
static std::mutex held_lock;
static std::map<int, int> held;

// "hci0, hci1" from what the kernel lists, or "" when it lists none.
static std::string adapters_here() {
    std::vector<std::string> names;
    DIR* dir = opendir("/sys/class/bluetooth");
    for (struct dirent* e; dir != nullptr && (e = readdir(dir)) != nullptr;) {
        if (strncmp(e->d_name, "hci", 3) == 0 && strchr(e->d_name, ':') == nullptr) names.push_back(e->d_name);
    }
    if (dir != nullptr) closedir(dir);
    std::sort(names.begin(), names.end());
    std::string list;
    for (const std::string& n : names) list += (list.empty() ? "" : ", ") + n;
    return list;
}

static std::string refusal(int err, int index) {
    std::string n = std::to_string(index);
    switch (err) {
        case EAFNOSUPPORT:
            return "this kernel has no Bluetooth (no AF_BLUETOOTH sockets): load its module with modprobe bluetooth, "
                   "or use a kernel built with Bluetooth";
        case EPERM:
        case EACCES:
            return "no permission: the HCI user channel needs CAP_NET_ADMIN; run as root, e.g. with sudo (a file "
                   "capability on java does not work: its launcher then fails to find its own libraries)";
        case EBUSY:
            return "the adapter is up or in use, for example by the system's Bluetooth service: bring it down, e.g. "
                   "btmgmt --index " + n + " power off, or stop the service (systemctl stop bluetooth)";
        case ENODEV: {
            std::string here = adapters_here();
            return "there is no adapter hci" + n + (here.empty() ? "; the kernel knows no Bluetooth adapter here"
                                                                 : "; the kernel knows " + here + " (ls /sys/class/bluetooth)");
        }
        case EINVAL:
            return "the kernel refused adapter index " + n + " (Invalid argument)";
        default:
            return std::string("bind: ") + strerror(err);
    }
}

// Waits kBusyRetryMs for the wake descriptor; true when it woke.
static bool woken_within_retry(int wake) {
    struct pollfd pfd = {wake, POLLIN, 0};
    return poll(&pfd, wake >= 0 ? 1 : 0, kBusyRetryMs) > 0;
}

static int bind_with_retry(int index, int wake, std::string* why) {
    auto give_up = std::chrono::steady_clock::now() + std::chrono::milliseconds(kBusyWaitMs);
    for (;;) {
        int fd = opener.load()(index);
        if (fd != -1) {
            fcntl(fd, F_SETFL, fcntl(fd, F_GETFL) | O_NONBLOCK);
            return fd;
        }
        int err = errno;
        if (err != EBUSY || std::chrono::steady_clock::now() >= give_up) return *why = refusal(err, index), -1;
        if (woken_within_retry(wake)) return *why = "closed while connecting", -1;
    }
}

int hci_user_take(int index, int wake, std::string* why) {
    std::lock_guard<std::mutex> guard(held_lock);
    auto it = held.find(index);
    if (it == held.end()) {
        int fd = bind_with_retry(index, wake, why);
        if (fd == -1) return -1;
        it = held.emplace(index, fd).first;
    }
    // A session closes its own descriptor; the channel stays bound through the held one.
    int fd = fcntl(it->second, F_DUPFD_CLOEXEC, 0);
    if (fd == -1) *why = std::string("dup: ") + strerror(errno);
    return fd;
}

void hci_user_lost(int index) {
    std::lock_guard<std::mutex> guard(held_lock);
    auto it = held.find(index);
    if (it == held.end()) return;
    close(it->second);
    held.erase(it);
}
