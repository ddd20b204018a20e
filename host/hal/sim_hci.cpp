// IBluetoothHci on a simulated controller: sendHciCommand queues the command;
// the event thread hands it to the controller and delivers the events, so
// callbacks never run inside the caller's stack. Close joins the thread.
#include "host/hal/sim_hci.h"

#include <chrono>
#include <condition_variable>
#include <deque>
#include <memory>
#include <mutex>
#include <thread>
#include <vector>

#include "host/hal/btsnoop.h"
#include "host/hal/host_hci.h"
#include "host/hal/host_log.h"

namespace {

// Every simulated controller of the process shares one air.
std::shared_ptr<SimAir> process_air() {
    static auto* air = new std::shared_ptr<SimAir>(std::make_shared<SimAir>());
    return *air;
}

class SimHci final : public HostHci {
  public:
    explicit SimHci(SimControllerSettings settings)
        : settings_(settings), air_(process_air()), controller_(*air_, settings) {}
    ~SimHci() override { stop(); }

    Return<void> initialize(const sp<IBluetoothHciCallbacks>& callback) override;

  private:
    struct Work {
        std::vector<uint8_t> command;
    };
    Return<void> send(uint8_t type, const hidl_vec<uint8_t>& packet) override;
    void eventLoop();
    bool nextWork(Work* work);
    void answer(const std::vector<uint8_t>& command);
    void stop() override;

    const SimControllerSettings settings_;
    std::shared_ptr<SimAir> air_;  // outlives controller_, which runs tests on it
    SimController controller_;     // event thread only (and stop, after the join)
    sp<IBluetoothHciCallbacks> callbacks_;
    std::shared_ptr<Btsnoop> snoop_;
    std::mutex lock_;
    std::condition_variable wake_;
    std::deque<Work> queue_;
    bool running_ = false;
    std::thread thread_;
};

Return<void> SimHci::initialize(const sp<IBluetoothHciCallbacks>& callback) {
    stop();  // a second initialize starts a fresh session
    std::lock_guard<std::mutex> guard(lock_);
    callbacks_ = callback;
    snoop_ = Btsnoop::fromEnvironment();
    running_ = true;
    thread_ = std::thread(&SimHci::eventLoop, this);
    return Void();
}

// Commands go to the event thread. ACL and SCO data are only captured: the
// test modes carry none, and a controller in them would discard it too.
Return<void> SimHci::send(uint8_t type, const hidl_vec<uint8_t>& packet) {
    std::lock_guard<std::mutex> guard(lock_);
    if (type == H4_TYPE_COMMAND && !running_) {
        HLOGE("sim: command sent outside a session, dropped");
        return Void();
    }
    if (snoop_) snoop_->record(type, packet.data(), packet.size(), false);
    if (type != H4_TYPE_COMMAND) return Void();
    queue_.push_back({std::vector<uint8_t>(packet.begin(), packet.end())});
    wake_.notify_one();
    return Void();
}

bool SimHci::nextWork(Work* work) {
    std::unique_lock<std::mutex> guard(lock_);
    wake_.wait(guard, [this] { return !running_ || !queue_.empty(); });
    if (!running_) return false;
    *work = std::move(queue_.front());
    queue_.pop_front();
    return true;
}

// The processing delay is waited out as a stop can cut it short.
void SimHci::answer(const std::vector<uint8_t>& command) {
    if (settings_.delay_s > 0) {
        std::unique_lock<std::mutex> guard(lock_);
        auto delay = std::chrono::duration<double>(settings_.delay_s);
        if (wake_.wait_for(guard, delay, [this] { return !running_; })) return;
    }
    for (const auto& event : controller_.command(command.data(), command.size())) {
        if (snoop_) snoop_->record(H4_TYPE_EVENT, event.data(), event.size(), true);
        callbacks_->hciEventReceived(hidl_vec<uint8_t>(event));
    }
}

// callbacks_ and snoop_ change only while this thread is not running. The
// answer to initialize comes first and always, even if close follows at once.
void SimHci::eventLoop() {
    callbacks_->initializationComplete(Status::SUCCESS);
    Work work;
    while (nextWork(&work)) answer(work.command);
}

void SimHci::stop() {
    {
        std::lock_guard<std::mutex> guard(lock_);
        running_ = false;
        queue_.clear();
        wake_.notify_one();
    }
    if (thread_.joinable()) thread_.join();
    controller_.endTests();
    std::lock_guard<std::mutex> guard(lock_);
    callbacks_.clear();
    snoop_.reset();
}

}  // namespace

sp<IBluetoothHci> create_sim_hci(SimControllerSettings settings) { return new SimHci(settings); }
