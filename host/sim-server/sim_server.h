// halvenor-sim's serving: a listener, and one simulated controller per
// connection, all on one air. The accept loop runs on the caller's thread,
// each connection on a thread of its own.
#pragma once

#include <string>

#include "host/hal/sim_controller.h"

struct SimServerOptions {
    std::string unix_path;  // listen on this unix socket, else on loopback TCP
    std::string vhci;       // or serve one controller to the kernel through this device
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

// Registers a controller with the kernel through the vhci device (a raw one,
// which the kernel does not set up itself); *where is the adapter as
// HALVENOR_HCI takes it ("hci:N"). Closing the descriptor removes the adapter.
// -1 on failure, with the reason and its remedy in *why.
int sim_server_vhci(const std::string& device, std::string* where, std::string* why);
// Serves the one controller on fd until it ends or stop_fd becomes readable.
void sim_server_serve(int fd, int stop_fd, const SimControllerSettings& settings);
