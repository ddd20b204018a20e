// halvenor-sim: serves simulated controllers as H4 on a unix socket or a
// loopback TCP port, one controller per connection, all on one air. The main
// thread accepts; SIGINT and SIGTERM stop it cleanly.
#include <fcntl.h>
#include <signal.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <unistd.h>

#include <string>

#include "host/sim-server/sim_server.h"

static int stop_pipe[2] = {-1, -1};

static void on_signal(int) {
    char byte = 1;
    ssize_t ignored = write(stop_pipe[1], &byte, 1);
    (void)ignored;
}

static void usage() {
    fprintf(stderr,
            "usage: halvenor-sim [--unix PATH | --tcp PORT] [--reftx 0|1] [--loss FRACTION]\n"
            "  --unix PATH      listen on a unix socket\n"
            "  --tcp PORT       listen on 127.0.0.1:PORT (default; 0 picks a free port)\n"
            "  --reftx 0|1      a reference transmitter follows every receiver test (default 0)\n"
            "  --loss FRACTION  fraction of packets each receiver misses, 0 to 1 (default 0)\n"
            "Prints the address to give HALVENOR_HCI, e.g. 'listening on tcp:127.0.0.1:40123'.\n");
}

static bool parse_args(int argc, char** argv, SimServerOptions* options) {
    for (int i = 1; i < argc; ++i) {
        std::string arg = argv[i];
        if (i + 1 >= argc) return false;
        std::string value = argv[++i];
        char* end = nullptr;
        if (arg == "--unix") {
            options->unix_path = value;
        } else if (arg == "--tcp") {
            long port = strtol(value.c_str(), &end, 10);
            if (*end != '\0' || port < 0 || port > 65535) return false;
            options->tcp_port = static_cast<int>(port);
        } else if (arg == "--reftx" && (value == "0" || value == "1")) {
            options->controller.reference_tx = value == "1";
        } else if (arg == "--loss") {
            double loss = strtod(value.c_str(), &end);
            if (*end != '\0' || !(loss >= 0.0 && loss <= 1.0)) return false;
            options->controller.loss = loss;
        } else {
            return false;
        }
    }
    return true;
}

int main(int argc, char** argv) {
    SimServerOptions options;
    if (!parse_args(argc, argv, &options)) {
        usage();
        return 2;
    }
    if (pipe2(stop_pipe, O_CLOEXEC) == -1) {
        perror("halvenor-sim: pipe");
        return 1;
    }
    signal(SIGPIPE, SIG_IGN);
    signal(SIGINT, on_signal);
    signal(SIGTERM, on_signal);

    std::string where;
    int listen_fd = sim_server_listen(options, &where);
    if (listen_fd == -1) {
        fprintf(stderr, "halvenor-sim: cannot listen (see the log line above)\n");
        return 1;
    }
    printf("listening on %s\n", where.c_str());
    fflush(stdout);
    sim_server_run(listen_fd, stop_pipe[0], options.controller);
    close(listen_fd);
    if (!options.unix_path.empty()) unlink(options.unix_path.c_str());
    return 0;
}
