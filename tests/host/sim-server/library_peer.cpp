// A second library process for the shared-air tests: runs one LE test through
// libhalvenor.so's entry points on HALVENOR_HCI, ends it when a line (or end
// of input) comes on stdin, and reports on stdout. Main thread only.
//
//   library_peer CODE     CODE as sendBleTestCommand takes it, e.g. 12440 or 22440
//
// stdout: "started T0 T1" once the test runs (or "failed"), then "ended COUNT
// T2 T3" and "closed"; T0..T3 bracket the start and end calls on the monotonic
// clock (microseconds, comparable across processes); COUNT is the Test End's
// packet count as the library logs it, -1 if it logged none or several.
#include <stdio.h>
#include <stdlib.h>

#include <chrono>
#include <iostream>
#include <string>

#include "engine/test_mode.h"
#include "tests/support/log_capture.h"

namespace {

const int kTestEndCode = 3000;
const char kCountPrefix[] = "onReceivedTestData() value: ";

long long monotonicUs() {
    return std::chrono::duration_cast<std::chrono::microseconds>(
                   std::chrono::steady_clock::now().time_since_epoch())
            .count();
}

// Runs one test command; true when the library reported it answered.
bool runCommand(const LogCapture& log, int code, long long* before, long long* after) {
    *before = monotonicUs();
    sendBleTestCommand(code, 0);
    *after = monotonicUs();
    return log.contains(ANDROID_LOG_INFO, "onSendCmdSuccess() command: " + std::to_string(code));
}

// The count of the one "onReceivedTestData() value: N" line logged so far, else -1.
int loggedCount(const LogCapture& log) {
    int count = -1, seen = 0;
    for (const LogLine& line : log.lines()) {
        if (line.text.rfind(kCountPrefix, 0) != 0) continue;
        count = atoi(line.text.c_str() + sizeof(kCountPrefix) - 1);
        ++seen;
    }
    return seen == 1 ? count : -1;
}

}  // namespace

int main(int argc, char** argv) {
    if (argc != 2) {
        fprintf(stderr, "usage: library_peer CODE\n");
        return 2;
    }
    LogCapture log;
    long long t0, t1, t2, t3;
    if (!runCommand(log, atoi(argv[1]), &t0, &t1)) {
        printf("failed\n");
        hci_disable_device_under_test_mode();
        return 1;
    }
    printf("started %lld %lld\n", t0, t1);
    fflush(stdout);

    std::string line;
    std::getline(std::cin, line);  // the test's signal to end; end of input ends it too
    log.clear();
    bool ended = runCommand(log, kTestEndCode, &t2, &t3);
    printf("ended %d %lld %lld\n", ended ? loggedCount(log) : -1, t2, t3);
    hci_disable_device_under_test_mode();
    printf("closed\n");
    return 0;
}
