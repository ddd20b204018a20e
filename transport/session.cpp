// HAL client session: finds and initialises the HAL, builds the socket-pair
// bridge and starts the pump. Opening and closing run on the Java thread; the
// callbacks run on HAL threads.
#include "transport/session.h"

#include <errno.h>
#include <pthread.h>
#include <semaphore.h>
#include <string.h>
#include <sys/socket.h>
#include <time.h>
#include <unistd.h>

#include <mutex>
#include <vector>

#include "transport/h4.h"
#include "transport/log.h"
#include "transport/pump.h"

using android::sp;
using android::wp;
using android::hardware::hidl_death_recipient;
using android::hardware::hidl_vec;
using android::hardware::Return;
using android::hardware::Void;
using android::hidl::base::V1_0::IBase;
using android::hardware::bluetooth::V1_0::IBluetoothHci;
using android::hardware::bluetooth::V1_0::IBluetoothHciCallbacks;
using android::hardware::bluetooth::V1_0::Status;

int server_fd = -1;
int client_fd = -1;
sp<IBluetoothHci> btHci;
int bt_fd = -1;
uint8_t cmd_test_end_flag = 0;

// Slow firmware downloads take a few seconds; past this the HAL is not coming.
static const int kInitTimeoutMs = 10000;

static bool hidl_ready = false;
static sem_t init_sem;
static pthread_t tool_thread;
static bool tool_thread_started = false;

// Guards hidl_ready, which callback object may still end the current
// initialisation wait (so a late answer to an abandoned opening is ignored),
// and which service's death notice concerns the current session.
static std::mutex init_lock;
static const IBluetoothHciCallbacks* init_waiter = nullptr;
static uint64_t session_cookie = 0;

// Held while a callback writes to server_fd and while server_fd is replaced
// or closed, so no callback writes into a closed or reused descriptor.
static std::mutex bridge_lock;

namespace {

// Told when the HAL's process dies: the session cannot carry anything more,
// so an opening waiting for the HAL gives up at once and the engine finds the
// bridge ended instead of waiting out its time-outs.
class HalDeathRecipient : public hidl_death_recipient {
  public:
    void serviceDied(uint64_t cookie, const wp<IBase>& who) override;
};

class BluetoothHciCallbacks : public IBluetoothHciCallbacks {
  public:
    ~BluetoothHciCallbacks() override = default;
    Return<void> initializationComplete(Status status) override;
    Return<void> hciEventReceived(const hidl_vec<uint8_t>& event) override;
    Return<void> aclDataReceived(const hidl_vec<uint8_t>& data) override;
    Return<void> scoDataReceived(const hidl_vec<uint8_t>& data) override;
};

// Ends the opening's wait for the HAL; init_lock is held.
void end_init_wait_locked(bool ready) {
    hidl_ready = ready;
    init_waiter = nullptr;
    sem_post(&init_sem);
}

// Type byte and packet go out in one locked write: packets from callbacks on
// several HAL threads never interleave in the stream. A packet whose size
// disagrees with its own header would shift every packet after it, so it is
// dropped.
void write_to_tool(uint8_t type, const hidl_vec<uint8_t>& packet, const char* callback) {
    if (!h4_packet_agrees(type, packet.data(), packet.size())) {
        LOGE("%s: packet of %zu bytes disagrees with its header, dropped", callback, packet.size());
        return;
    }
    std::vector<unsigned char> h4(packet.size() + 1);
    h4[0] = type;
    if (packet.size() > 0) memcpy(h4.data() + 1, packet.data(), packet.size());

    std::lock_guard<std::mutex> guard(bridge_lock);
    if (safe_write(server_fd, h4.data(), static_cast<int>(h4.size())) == -1) {
        LOGE("%s: failed to write event to tool socket", callback);
    }
}

Return<void> BluetoothHciCallbacks::initializationComplete(Status status) {
    bool ok = status == Status::SUCCESS;
    if (!ok) LOGE("Error in HIDL initialization");

    std::lock_guard<std::mutex> guard(init_lock);
    if (init_waiter != this) {
        LOGE("%s: answer to an abandoned opening ignored", "initializationComplete");
        return Void();
    }
    end_init_wait_locked(ok);
    return Void();
}

Return<void> BluetoothHciCallbacks::hciEventReceived(const hidl_vec<uint8_t>& event) {
    write_to_tool(H4_TYPE_EVENT, event, "hciEventReceived");
    return Void();
}

Return<void> BluetoothHciCallbacks::aclDataReceived(const hidl_vec<uint8_t>& data) {
    write_to_tool(H4_TYPE_ACL, data, "aclDataReceived");
    return Void();
}

Return<void> BluetoothHciCallbacks::scoDataReceived(const hidl_vec<uint8_t>& data) {
    write_to_tool(H4_TYPE_SCO, data, "scoDataReceived");
    return Void();
}

void HalDeathRecipient::serviceDied(uint64_t cookie, const wp<IBase>&) {
    {
        std::lock_guard<std::mutex> guard(init_lock);
        if (cookie != session_cookie) return;  // an earlier session's service
        LOGE("%s: the Bluetooth HAL died", "serviceDied");
        if (init_waiter != nullptr) end_init_wait_locked(false);
    }
    std::lock_guard<std::mutex> guard(bridge_lock);
    if (server_fd != -1) shutdown(server_fd, SHUT_RDWR);
}

}  // namespace

// Linked to the service of each session; the cookie names the session.
static sp<hidl_death_recipient> hal_death;

void hidl_client_close_tool_end() {
    if (client_fd != -1) close(client_fd);
    // The pump reads client_fd on its own thread when a wait times out.
    __atomic_store_n(&client_fd, -1, __ATOMIC_RELEASE);
    bt_fd = -1;
}

void hidl_client_stop_bridge() {
    // shutdown wakes a pump blocked in its wait or read, and a callback
    // blocked in a write, without freeing the descriptor number; only once the
    // pump is joined is the number given back.
    if (server_fd != -1) shutdown(server_fd, SHUT_RDWR);
    if (tool_thread_started) {
        pthread_join(tool_thread, nullptr);
        tool_thread_started = false;
    }
    std::lock_guard<std::mutex> guard(bridge_lock);
    if (server_fd != -1) close(server_fd);
    server_fd = -1;
}

// A dead service's unlink fails; there is nothing left to unlink then.
static void unlink_death_notice() {
    if (hal_death == nullptr) return;
    Return<bool> unlinked = btHci->unlinkToDeath(hal_death);
    unlinked.isOk();
}

void hidl_client_release_service(const char* caller) {
    if (btHci == nullptr) return;
    unlink_death_notice();
    if (!btHci->close().isOk()) LOGI("%s: HIDL daemon is dead", caller);
    btHci.clear();
}

// A failed opening gives back the service it obtained, closed when it was
// initialised, so no HAL stays initialised behind a session that never was.
// The opening has logged why it failed; a dead HAL's close adds nothing.
static void abandon_service(bool initialised) {
    unlink_death_notice();
    if (initialised) {
        Return<void> closed = btHci->close();
        closed.isOk();
    }
    btHci.clear();
}

// An opening replaces whatever an earlier session left, pump and bridge first,
// so no thread or descriptor outlives its session.
static void end_previous_session() {
    hidl_client_close_tool_end();
    hidl_client_stop_bridge();
    hidl_client_release_service("hidl_client_initialize");
}

static bool arm_init_wait(const IBluetoothHciCallbacks* waiter) {
    std::lock_guard<std::mutex> guard(init_lock);
    hidl_ready = false;
    init_waiter = waiter;
    return sem_init(&init_sem, 0, 0) == 0;
}

static void disarm_init_wait() {
    std::lock_guard<std::mutex> guard(init_lock);
    init_waiter = nullptr;
}

// The death notice of the new service names a new session. A HAL that will
// not give one still works; only its death is noticed later, at a send.
static bool link_death_notice() {
    uint64_t cookie;
    {
        std::lock_guard<std::mutex> guard(init_lock);
        cookie = ++session_cookie;
    }
    if (hal_death == nullptr) hal_death = new HalDeathRecipient();
    Return<bool> linked = btHci->linkToDeath(hal_death, cookie);
    if (!linked.isOk()) {
        LOGE("%s: the HAL died before initialize: %s", "hidl_client_initialize",
             linked.description().c_str());
        return false;
    }
    if (!linked) LOGI("%s: the HAL gives no death notice", "hidl_client_initialize");
    return true;
}

// Waits, bounded, for initializationComplete; true when the HAL answered.
static bool wait_for_init() {
    struct timespec deadline;
    clock_gettime(CLOCK_REALTIME, &deadline);
    deadline.tv_sec += kInitTimeoutMs / 1000;
    deadline.tv_nsec += (kInitTimeoutMs % 1000) * 1000000L;
    if (deadline.tv_nsec >= 1000000000L) {
        deadline.tv_sec += 1;
        deadline.tv_nsec -= 1000000000L;
    }
    int rc;
    while ((rc = sem_timedwait(&init_sem, &deadline)) == -1 && errno == EINTR) {
    }
    std::lock_guard<std::mutex> guard(init_lock);
    // A post that raced the time-out still counts; otherwise disown the wait.
    bool answered = rc == 0 || init_waiter == nullptr;
    init_waiter = nullptr;
    if (!answered) {
        LOGE("%s: no answer from the HAL within %d ms", "hidl_client_initialize", kInitTimeoutMs);
    }
    return answered && hidl_ready;
}

static bool initialize_hal() {
    sp<IBluetoothHciCallbacks> callbacks = new BluetoothHciCallbacks();
    if (!arm_init_wait(callbacks.get())) {
        LOGE("%s: sem_init failed: %s", "hidl_client_initialize", strerror(errno));
        return false;
    }
    Return<void> started = btHci->initialize(callbacks);
    if (!started.isOk()) {
        disarm_init_wait();
        LOGE("%s: initialize failed: %s", "hidl_client_initialize", started.description().c_str());
        return false;
    }
    return wait_for_init();
}

static bool open_bridge() {
    int fds[2];
    if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, fds) == -1) {
        LOGE("%s error creating socketpair: %s", "hidl_client_initialize", strerror(errno));
        return false;
    }
    {
        std::lock_guard<std::mutex> guard(bridge_lock);
        server_fd = fds[0];
    }
    client_fd = fds[1];

    int err = pthread_create(&tool_thread, nullptr, process_tool_data, nullptr);
    if (err != 0) {
        LOGE("%s:Unable to create pthread err = %s", "hidl_client_initialize", strerror(err));
        hidl_client_close_tool_end();
        hidl_client_stop_bridge();
        return false;
    }
    tool_thread_started = true;
    return true;
}

bool hidl_client_initialize(int, int* tool_fd) {
    cmd_test_end_flag = 0;
    LOGI("init cmd_test_end_flag = %s", "false");
    if (tool_fd == nullptr) {
        LOGE("%s: Invalid tool FD", "hidl_client_initialize");
        return false;
    }
    LOGI("%s: Initialize the HIDL with Mode BT", "hidl_client_initialize");
    end_previous_session();

    btHci = IBluetoothHci::getService("default", false);
    if (btHci == nullptr) {
        LOGE("Unable to initialize the HIDL");
        return false;
    }
    LOGI("%s: IBluetoothHci::getService() returned %p (%s)", "hidl_client_initialize",
         btHci.get(), btHci->isRemote() ? "remote" : "local");
    if (!link_death_notice()) {
        abandon_service(false);
        return false;
    }

    if (!initialize_hal()) {
        LOGE("%s: HIDL failed to initialize, sending invalid FD to tool", "hidl_client_initialize");
        abandon_service(true);
        return false;
    }
    LOGE("%s: HIDL = true", "hidl_client_initialize");

    if (!open_bridge()) {
        abandon_service(true);
        return false;
    }
    LOGE("Server FD=%d  Client FD: %d\n", server_fd, client_fd);
    *tool_fd = client_fd;
    return true;
}

void hidl_client_init() {
    LOGE("%s: use HIDL", "hidl_client_init");
    if (!hidl_client_initialize(0, &bt_fd)) {
        LOGI("%s: HIDL client initialization failed \n", "hidl_client_init");
        bt_fd = -1;
    }
}

void hidl_client_close() {
    if (!hidl_ready) {
        LOGI("%s: Hidl init = false", "hidl_client_close");
        return;
    }
    hidl_client_stop_bridge();
    LOGI("%s: Close HIDL with Mode BT", "hidl_client_close");
    hidl_client_release_service("hidl_client_close");
}
