// A simulated controller behind a host HAL: a command sent is queued; the
// event thread hands it to the controller and delivers the events, so the
// client is never called inside the sender's stack. Stop joins the thread.
#include "host/hal/sim_hci.h"

#include <chrono>
#include <condition_variable>
#include <deque>
#include <memory>
#include <mutex>
#include <thread>
#include <vector>

#include "host/hal/btsnoop.h"
#include "host/hal/host_log.h"
#include "transport/h4_frame.h"

namespace {

// Every simulated controller of the process shares one air.
std::shared_ptr<SimAir> process_air() {
    static auto* air = new std::shared_ptr<SimAir>(std::make_shared<SimAir>());
    return *air;
}

class SimHci final : public HostController {
  public:
    explicit SimHci(SimControllerSettings settings)
        : settings_(settings), air_(process_air()), controller_(*air_, settings) {}
    ~SimHci() override { stop(); }

    void start(std::shared_ptr<ControllerClient> client) override;
    bool send(uint8_t type, const uint8_t* packet, size_t len) override;
    void stop() override;

  private:
    struct Work {
        std::vector<uint8_t> command;
    };
    void eventLoop();
    bool nextWork(Work* work);
    void answer(const std::vector<uint8_t>& command);

    const SimControllerSettings settings_;
    std::shared_ptr<SimAir> air_;  // outlives controller_, which runs tests on it
    SimController controller_;     // event thread only (and stop, after the join)
    std::shared_ptr<ControllerClient> client_;
    std::shared_ptr<Btsnoop> snoop_;
    std::mutex lock_;
    std::condition_variable wake_;
    std::deque<Work> queue_;
    bool running_ = false;
    std::thread thread_;
};

void SimHci::start(std::shared_ptr<ControllerClient> client) {
    stop();  // a second start begins a fresh session
    std::lock_guard<std::mutex> guard(lock_);
    client_ = std::move(client);
    snoop_ = Btsnoop::fromEnvironment();
    running_ = true;
    thread_ = std::thread(&SimHci::eventLoop, this);
}

// Commands go to the event thread. ACL and SCO data are only captured: the
// test modes carry none, and a controller in them would discard it too.
bool SimHci::send(uint8_t type, const uint8_t* packet, size_t len) {
    std::lock_guard<std::mutex> guard(lock_);
    if (type == H4_TYPE_COMMAND && !running_) {
        HLOGE("sim: command sent outside a session, dropped");
        return true;
    }
    if (snoop_) snoop_->record(type, packet, len, false);
    if (type != H4_TYPE_COMMAND) return true;
    queue_.push_back({std::vector<uint8_t>(packet, packet + len)});
    wake_.notify_one();
    return true;
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
        client_->received(H4_TYPE_EVENT, event.data(), event.size());
    }
}

// client_ and snoop_ change only while this thread is not running. The
// answer to start comes first and always, even if stop follows at once.
void SimHci::eventLoop() {
    client_->initialized(true);
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
    client_.reset();
    snoop_.reset();
}

}  // namespace

std::unique_ptr<HostController> create_sim_hci(SimControllerSettings settings) {
    return std::make_unique<SimHci>(settings);
}
