// Two processes of libhalvenor.so on one halvenor-sim air: one runs a
// transmitter test, the other a receiver test, each through the library's own
// entry points (library_peer). The test process only starts and ends them.
#include <signal.h>
#include <stdio.h>
#include <stdlib.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <deque>
#include <string>
#include <thread>

#include <gtest/gtest.h>

#include "tests/host/host_test_support.h"
#include "tests/support/process.h"

namespace {

// Sanitized builds start slowly; a peer that has not answered by then is stuck.
const int kPeerAnswerMs = 30000;

struct Peer {
    Child child;
    long long start_before = 0, start_after = 0;  // around its start command
};

struct PeerEnd {
    int count = -1;  // Num_Packets of its Test End, as its library logged it
    long long end_before = 0, end_after = 0;
    int exit_status = -1;
};

class LibraryPeerTest : public ::testing::Test {
  protected:
    void SetUp() override {
        signal(SIGPIPE, SIG_IGN);  // a peer that died makes its stdin fail the write, not kill us
        path = tempPath("air.sock");
        server = spawnChild({HALVENOR_SIM_PATH, "--unix", path});
        ASSERT_EQ("listening on unix:" + path, readLine(server.out, kPeerAnswerMs));
        // The peers inherit it; this process never opens a session itself.
        setenv("HALVENOR_HCI", ("unix:" + path).c_str(), 1);
    }
    void TearDown() override {
        for (Peer& peer : peers) stopChild(peer.child);
        stopChild(server);
        unlink(path.c_str());  // halvenor-sim removes it on SIGTERM, not when killed
        unsetenv("HALVENOR_HCI");
    }
    // A library process with LE test `code` running; null when it did not start.
    Peer* startPeer(int code) {
        peers.push_back({spawnChild({HALVENOR_PEER_PATH, std::to_string(code)}, true)});
        Peer& peer = peers.back();
        std::string line = readLine(peer.child.out, kPeerAnswerMs);
        if (sscanf(line.c_str(), "started %lld %lld", &peer.start_before, &peer.start_after) != 2) {
            ADD_FAILURE() << "peer " << code << " said '" << line << "'";
            return nullptr;
        }
        return &peer;
    }
    // Ends the peer's test, lets it close its session and reaps it.
    PeerEnd endPeer(Peer* peer) {
        PeerEnd end;
        writeAll(peer->child.in, {'\n'});
        std::string line = readLine(peer->child.out, kPeerAnswerMs);
        EXPECT_EQ(3, sscanf(line.c_str(), "ended %d %lld %lld", &end.count, &end.end_before,
                            &end.end_after))
                << line;
        EXPECT_EQ("closed", readLine(peer->child.out, kPeerAnswerMs));
        int status = 0;
        pid_t pid = peer->child.pid;
        if (waitUntil([&] { return waitpid(pid, &status, WNOHANG) == pid; }, kPeerAnswerMs)) {
            peer->child.pid = -1;  // reaped: stopChild must not signal the number again
            end.exit_status = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
        }
        return end;
    }
    // Transmitter test tx_code in one library process and, while it runs,
    // receiver test rx_code in another for about ms; both must end and exit
    // cleanly. False when either did not start.
    bool runOnAir(int tx_code, int rx_code, int ms) {
        Peer* tx = startPeer(tx_code);
        Peer* rx = tx != nullptr ? startPeer(rx_code) : nullptr;
        if (rx == nullptr) return false;
        std::this_thread::sleep_for(std::chrono::milliseconds(ms));  // time on the air, not a sync
        rx_start_before = rx->start_before;
        rx_start_after = rx->start_after;
        rx_end = endPeer(rx);
        tx_end = endPeer(tx);
        EXPECT_EQ(0, rx_end.exit_status);
        EXPECT_EQ(0, tx_end.exit_status);
        return true;
    }

    std::string path;
    Child server;
    std::deque<Peer> peers;  // pointers to its elements stay valid as it grows
    long long rx_start_before = 0, rx_start_after = 0;  // set by runOnAir
    PeerEnd rx_end, tx_end;
};

TEST_F(LibraryPeerTest, ReceiverProcessCountsTransmitterProcessOnSameChannel) {
    ASSERT_TRUE(runOnAir(12440, 22440, 300));
    // The receiver ran at least from the end of its start call to the start
    // of its end call, at most from the start of one to the end of the other;
    // one packet every 625 us while it ran.
    long long shortest = rx_end.end_before - rx_start_after;
    long long longest = rx_end.end_after - rx_start_before;
    EXPECT_GE(rx_end.count, shortest / 625 * 9 / 10 - 5) << shortest << " us";
    EXPECT_LE(rx_end.count, longest / 625 * 11 / 10 + 5) << longest << " us";
    EXPECT_EQ(0, tx_end.count) << "a transmitter's Test End counts nothing";
}

TEST_F(LibraryPeerTest, ReceiverProcessHearsNothingFromTransmitterOnOtherChannel) {
    ASSERT_TRUE(runOnAir(12402, 22440, 100));
    EXPECT_EQ(0, rx_end.count);
}

}  // namespace
