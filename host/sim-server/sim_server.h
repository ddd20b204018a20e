// halvenor-sim's serving: a listener, and one simulated controller per
// connection, all on one air. The accept loop runs on the caller's thread,
// each connection on a thread of its own.
#pragma once

#include <string>

#include "host/hal/sim_controller.h"

struct SimServerOptions {
    std::string unix_path;  // listen on this unix socket, else on loopback TCP
    int tcp_port = 0;       // 0: a free port
    bool tcp_given = false;
    SimControllerSettings controller;
};

// Opens the listener; *where is its address as HALVENOR_HCI takes it
// ("unix:PATH" or "tcp:127.0.0.1:PORT"). -1 on failure, with the reason in
// *why: a unix path another process serves is refused, as a TCP port in use is.
int sim_server_listen(const SimServerOptions& options, std::string* where, std::string* why);
// Serves connections until stop_fd becomes readable, then ends them all.
void sim_server_run(int listen_fd, int stop_fd, const SimControllerSettings& settings);
