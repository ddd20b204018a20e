// HAL client session: opens a session with the Bluetooth HAL (the AIDL HAL
// where the platform declares it, the HIDL HAL otherwise), builds the
// socket-pair bridge to the engine and starts the pump; every path ends it
// through one teardown. Opening and closing run on the calling Java thread,
// the HAL's callbacks on HAL threads.
#include "transport/session.h"

#include <errno.h>
#include <pthread.h>
#include <string.h>
#include <sys/socket.h>
#include <time.h>
#include <unistd.h>

#include <mutex>
#include <vector>

#include "transport/h4.h"
#include "transport/hal.h"
#include "transport/log.h"
#include "transport/pump.h"

int server_fd = -1;
int client_fd = -1;
int bt_fd = -1;
uint8_t cmd_test_end_flag = 0;

// Slow firmware downloads take a few seconds; past this the HAL is not coming.
static const int kInitTimeoutMs = 10000;

static bool hidl_ready = false;
static pthread_t tool_thread;

// The rest of the session, reset as one by the teardown and the opening.
static struct {
    const HalAdapter* hal;    // the HAL of the open session, or null
    bool pump_started;        // tool_thread is to be joined
    const void* init_waiter;  // the callback object whose answer ends the opening's wait
    bool init_answered;
    uint64_t cookie;          // names the session's service in its death notices
} session;

// init_lock guards hidl_ready, the opening's wait and the cookie; init_done,
// signalled on the monotonic clock, which no change of the system time moves.
static pthread_mutex_t init_lock = PTHREAD_MUTEX_INITIALIZER;
static pthread_cond_t init_done;
static pthread_once_t init_done_made = PTHREAD_ONCE_INIT;
// Held while a callback writes to server_fd and while server_fd is replaced
// or closed, so no callback writes into a closed or reused descriptor.
static std::mutex bridge_lock;

static void make_init_done() {
    pthread_condattr_t attr;
    pthread_condattr_init(&attr);
    pthread_condattr_setclock(&attr, CLOCK_MONOTONIC);
    pthread_cond_init(&init_done, &attr);
    pthread_condattr_destroy(&attr);
}

// Ends the opening's wait for the HAL; init_lock is held.
static void end_init_wait_locked(bool ready) {
    hidl_ready = ready;
    session.init_answered = true;
    session.init_waiter = nullptr;
    pthread_cond_broadcast(&init_done);
}

void session_expect_initialized(const void* waiter) {
    pthread_mutex_lock(&init_lock);
    hidl_ready = false;
    session.init_waiter = waiter;
    session.init_answered = false;
    pthread_mutex_unlock(&init_lock);
}

// Only the answer to the opening in progress counts: a late answer to an
// abandoned one must not complete a later opening.
void session_initialized(const void* waiter, bool ok) {
    pthread_mutex_lock(&init_lock);
    bool current = waiter != nullptr && waiter == session.init_waiter;
    if (current) end_init_wait_locked(ok);
    pthread_mutex_unlock(&init_lock);
    if (!current) LOGE("%s: answer to an abandoned opening ignored", "initializationComplete");
}

// The session cannot carry anything more: an opening waiting for the HAL
// gives up at once, and the engine finds the bridge ended instead of waiting
// out its time-outs.
void session_hal_died(uint64_t cookie) {
    pthread_mutex_lock(&init_lock);
    bool current = cookie == session.cookie;
    if (current) {
        LOGE("%s: the Bluetooth HAL died", "serviceDied");
        if (session.init_waiter != nullptr) end_init_wait_locked(false);
    }
    pthread_mutex_unlock(&init_lock);
    if (!current) return;  // an earlier session's service
    std::lock_guard<std::mutex> guard(bridge_lock);
    if (server_fd != -1) shutdown(server_fd, SHUT_RDWR);
}

// Type byte and packet go out in one locked write: packets from callbacks on
// several HAL threads never interleave in the stream. A packet whose size
// disagrees with its own header would shift every packet after it, so it is
// dropped.
void session_deliver(uint8_t type, const uint8_t* packet, size_t len, const char* callback) {
    if (!h4_packet_agrees(type, packet, len)) {
        LOGE("%s: packet of %zu bytes disagrees with its header, dropped", callback, len);
        return;
    }
    std::vector<unsigned char> h4(len + 1);
    h4[0] = type;
    if (len > 0) memcpy(h4.data() + 1, packet, len);
    std::lock_guard<std::mutex> guard(bridge_lock);
    if (safe_write(server_fd, h4.data(), static_cast<int>(h4.size())) == -1) {
        LOGE("%s: failed to write event to tool socket", callback);
    }
}

HalSend session_send(uint8_t type, const uint8_t* packet, size_t len) {
    return session.hal != nullptr ? session.hal->send(type, packet, len) : HAL_SENT;
}

bool session_takes(uint8_t type) { return session.hal != nullptr && session.hal->takes(type); }

void hidl_client_close_tool_end() {
    if (client_fd != -1) close(client_fd);
    // The pump reads client_fd on its own thread when a wait times out.
    __atomic_store_n(&client_fd, -1, __ATOMIC_RELEASE);
    bt_fd = -1;
}

// shutdown wakes a pump blocked in its wait or read, and a callback blocked in
// a write, without freeing the descriptor number; only once the pump is joined
// is the number given back.
static void stop_bridge() {
    if (server_fd != -1) shutdown(server_fd, SHUT_RDWR);
    if (session.pump_started) {
        pthread_join(tool_thread, nullptr);
        session.pump_started = false;
    }
    std::lock_guard<std::mutex> guard(bridge_lock);
    if (server_fd != -1) close(server_fd);
    server_fd = -1;
}

// The one teardown, in the order that keeps every thread off released state:
// the tool end (when asked), the pump and the bridge end, then the HAL, closed
// and released. `line`, when given, is logged with `caller` before the HAL is
// closed.
static void end_session(const char* caller, bool close_tool_end, const char* line) {
    if (close_tool_end) hidl_client_close_tool_end();
    stop_bridge();
    if (line != nullptr) LOGI(line, caller);
    if (session.hal != nullptr) session.hal->release(caller);
    session.hal = nullptr;
}

void session_end(const char* caller) { end_session(caller, true, nullptr); }

// Waits, bounded, for the answer to initialize; true when the HAL said it is ready.
static bool wait_for_init() {
    struct timespec deadline;
    clock_gettime(CLOCK_MONOTONIC, &deadline);
    deadline.tv_sec += kInitTimeoutMs / 1000;
    pthread_mutex_lock(&init_lock);
    while (!session.init_answered && pthread_cond_timedwait(&init_done, &init_lock, &deadline) != ETIMEDOUT) {
    }
    bool answered = session.init_answered, ready = hidl_ready;
    session.init_waiter = nullptr;  // a late answer is ignored
    pthread_mutex_unlock(&init_lock);
    if (!answered) LOGE("%s: no answer from the HAL within %d ms", "hidl_client_initialize", kInitTimeoutMs);
    return answered && ready;
}

// A failed opening gives back the service it obtained, closed (the adapter
// leaves a HAL that another client holds unclosed).
static bool open_hal(const HalAdapter* hal) {
    pthread_once(&init_done_made, make_init_done);
    pthread_mutex_lock(&init_lock);
    uint64_t cookie = ++session.cookie;
    pthread_mutex_unlock(&init_lock);
    if (!hal->open(cookie)) return false;
    session.hal = hal;
    if (hal->initialize() && wait_for_init()) {
        LOGE(hal->ready_line, "hidl_client_initialize");
        return true;
    }
    session_expect_initialized(nullptr);
    LOGE(hal->failed_line, "hidl_client_initialize");
    hal->release(nullptr);
    session.hal = nullptr;
    return false;
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
        return false;
    }
    session.pump_started = true;
    return true;
}

bool hidl_client_initialize(int, int* tool_fd) {
    cmd_test_end_flag = 0;
    LOGI("init cmd_test_end_flag = %s", "false");
    if (tool_fd == nullptr) {
        LOGE("%s: Invalid tool FD", "hidl_client_initialize");
        return false;
    }
    // An opening replaces whatever an earlier session left, so no thread or
    // descriptor outlives its session.
    end_session("hidl_client_initialize", true, nullptr);
    if (!open_hal(aidl_hal_declared() ? &aidl_hal : &hidl_hal)) return false;
    if (!open_bridge()) {
        end_session("hidl_client_initialize", true, nullptr);
        return false;
    }
    LOGE("Server FD=%d  Client FD: %d\n", server_fd, client_fd);
    *tool_fd = client_fd;
    return true;
}

void hidl_client_init() {
    if (!aidl_hal_declared()) LOGE("%s: use HIDL", "hidl_client_init");
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
    end_session("hidl_client_close", false, "%s: Close HIDL with Mode BT");
}
