// IBluetoothHci on a simulated controller: sendHciCommand queues the command;
// the event thread hands it to the controller and delivers the events, so
// callbacks never run inside the caller's stack. Close joins the thread.
#include "host/hal/sim_hci.h"

#include <condition_variable>
#include <deque>
#include <memory>
#include <mutex>
#include <thread>
#include <vector>

#include "host/hal/btsnoop.h"
#include "host/hal/h4_stream.h"
#include "host/hal/host_log.h"

using android::sp;
using android::hardware::hidl_vec;
using android::hardware::Return;
using android::hardware::Void;
using android::hardware::bluetooth::V1_0::IBluetoothHci;
using android::hardware::bluetooth::V1_0::IBluetoothHciCallbacks;
using android::hardware::bluetooth::V1_0::Status;

namespace {

// Every simulated controller of the process shares one air.
std::shared_ptr<SimAir> process_air() {
    static auto* air = new std::shared_ptr<SimAir>(std::make_shared<SimAir>());
    return *air;
}

class SimHci : public IBluetoothHci {
  public:
    explicit SimHci(SimControllerSettings settings)
        : air_(process_air()), controller_(*air_, settings) {}
    ~SimHci() override { stop(); }

    Return<void> initialize(const sp<IBluetoothHciCallbacks>& callback) override;
    Return<void> sendHciCommand(const hidl_vec<uint8_t>& command) override;
    Return<void> sendAclData(const hidl_vec<uint8_t>& data) override { return drop(H4_ACL, data); }
    Return<void> sendScoData(const hidl_vec<uint8_t>& data) override { return drop(H4_SCO, data); }
    Return<void> close() override {
        stop();
        return Void();
    }

  private:
    struct Work {
        std::vector<uint8_t> command;
    };
    Return<void> drop(uint8_t type, const hidl_vec<uint8_t>& data);
    void eventLoop();
    bool nextWork(Work* work);
    void answer(const std::vector<uint8_t>& command);
    void stop();

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

Return<void> SimHci::sendHciCommand(const hidl_vec<uint8_t>& command) {
    std::lock_guard<std::mutex> guard(lock_);
    if (!running_) {
        HLOGE("sim: command sent outside a session, dropped");
        return Void();
    }
    if (snoop_) snoop_->record(H4_COMMAND, command.data(), command.size(), false);
    queue_.push_back({std::vector<uint8_t>(command.begin(), command.end())});
    wake_.notify_one();
    return Void();
}

// The test modes carry no data; a controller in them would discard it too.
Return<void> SimHci::drop(uint8_t type, const hidl_vec<uint8_t>& data) {
    std::lock_guard<std::mutex> guard(lock_);
    if (snoop_) snoop_->record(type, data.data(), data.size(), false);
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

void SimHci::answer(const std::vector<uint8_t>& command) {
    for (const auto& event : controller_.command(command.data(), command.size())) {
        if (snoop_) snoop_->record(H4_EVENT, event.data(), event.size(), true);
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
