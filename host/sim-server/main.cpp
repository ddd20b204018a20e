// halvenor-sim: serves simulated controllers as H4 on a unix socket or a
// loopback TCP port, one controller per connection, all on one air, or one
// controller to the kernel through /dev/vhci. The main thread accepts (or
// serves the one); SIGINT and SIGTERM stop it cleanly.
#include <fcntl.h>
#include <signal.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <unistd.h>

#include <string>

#include "host/hal/sim_settings.h"
#include "host/sim-server/sim_server.h"

static int stop_pipe[2] = {-1, -1};

static void on_signal(int) {
    char byte = 1;
    ssize_t ignored = write(stop_pipe[1], &byte, 1);
    (void)ignored;
}

static bool take_unix(const char* text, SimServerOptions* o, std::string* range) {
    if (*text == '\0') return *range = "a socket path", false;
    o->unix_path = text;
    return true;
}

static bool take_vhci(const char* text, SimServerOptions* o, std::string* range) {
    if (*text == '\0') return *range = "a device, /dev/vhci", false;
    o->vhci = text;
    return true;
}

static bool take_tcp(const char* text, SimServerOptions* o, std::string* range) {
    char* end = nullptr;
    long port = strtol(text, &end, 10);
    if (*text == '\0' || *end != '\0' || port < 0 || port > 65535) {
        return *range = "a port from 0 to 65535 (0: a free one)", false;
    }
    o->tcp_port = static_cast<int>(port);
    o->tcp_given = true;
    return true;
}

// The options, each once: its name, its value, what it does; the usage and
// the parser both read this table.
struct OptionRow {
    const char* name;
    const char* value;
    const char* help;
    bool (*take_server)(const char*, SimServerOptions*, std::string*);
    bool (*take_controller)(const char*, SimControllerSettings*, std::string*);
};

static const OptionRow kOptions[] = {
        {"unix", "PATH", "listen on a unix socket", take_unix, nullptr},
        {"tcp", "PORT", "listen on 127.0.0.1:PORT, 0 to 65535 (the default; 0 picks a free port)", take_tcp, nullptr},
        {"vhci", "DEVICE", "serve one controller to this machine's kernel through DEVICE (/dev/vhci): it appears"
                           " as an adapter, for --hci hci:N (Linux, root)", take_vhci, nullptr},
        {"reftx", "0|1", "1: a reference transmitter follows every receiver test (default 0)", nullptr, sim_take_reftx},
        {"loss", "FRACTION", "share of packets each receiver misses at random, 0 to 1 (default 0)", nullptr, sim_take_loss},
        {"burst", "PACKETS", "mean length of a burst of lost packets, 1 to 1000 (default 1: each on its own)", nullptr,
         sim_take_burst},
        {"seed", "N", "seed of the losses, to repeat a run (default 0: a seed of its own)", nullptr, sim_take_seed},
        {"delay", "SECONDS", "seconds each command takes the controller, 0 to 10 (default 0)", nullptr, sim_take_delay},
};

static void usage(FILE* out) {
    fprintf(out, "usage: halvenor-sim [--unix PATH | --tcp PORT | --vhci DEVICE] [options]\n");
    for (const OptionRow& o : kOptions) {
        std::string left = std::string("--") + o.name + " " + o.value;
        fprintf(out, "  %-18s %s\n", left.c_str(), o.help);  // a test holds these to the console's table
    }
    fprintf(out, "Prints the address to give HALVENOR_HCI, e.g. 'listening on tcp:127.0.0.1:40123'.\n");
}

static const OptionRow* find_option(const std::string& name) {
    for (const OptionRow& o : kOptions) {
        if (name == o.name) return &o;
    }
    return nullptr;
}

// One option and its value; false after the error line.
static bool take(const std::string& name, const char* value, SimServerOptions* options) {
    const OptionRow* o = find_option(name);
    if (o == nullptr) {
        fprintf(stderr, "halvenor-sim: unknown option '--%s'\n", name.c_str());
        return false;
    }
    if (value == nullptr || (value[0] == '-' && value[1] != '\0')) {
        fprintf(stderr, "halvenor-sim: option --%s needs a value (%s)\n", o->name, o->value);
        return false;
    }
    std::string range;
    bool ok = o->take_server != nullptr ? o->take_server(value, options, &range)
                                        : o->take_controller(value, &options->controller, &range);
    if (!ok) fprintf(stderr, "halvenor-sim: bad --%s '%s': expected %s\n", o->name, value, range.c_str());
    return ok;
}

// "--name value" or "--name=value"; a value written apart never starts with '-'.
static bool parse_args(int argc, char** argv, SimServerOptions* options) {
    for (int i = 1; i < argc; ++i) {
        std::string arg = argv[i];
        if (arg.rfind("--", 0) != 0) {
            fprintf(stderr, "halvenor-sim: unexpected argument '%s'\n", arg.c_str());
            return false;
        }
        size_t eq = arg.find('=');
        std::string name = arg.substr(2, eq == std::string::npos ? std::string::npos : eq - 2);
        const char* value = eq != std::string::npos ? argv[i] + eq + 1 : (i + 1 < argc ? argv[++i] : nullptr);
        if (eq != std::string::npos && *value == '\0') value = nullptr;
        if (!take(name, value, options)) return false;
    }
    if (!options->unix_path.empty() + options->tcp_given + !options->vhci.empty() > 1) {
        fprintf(stderr, "halvenor-sim: %s exclude each other: give one\n",
                options->vhci.empty() ? "--unix and --tcp" : "--unix, --tcp and --vhci");
        return false;
    }
    return true;
}

static int serve_vhci(const SimServerOptions& options) {
    std::string where, why;
    int fd = sim_server_vhci(options.vhci, &where, &why);
    if (fd == -1) {
        fprintf(stderr, "halvenor-sim: %s\n", why.c_str());
        return 1;
    }
    printf("serving %s through %s\n", where.c_str(), options.vhci.c_str());
    fflush(stdout);
    sim_server_serve(fd, stop_pipe[0], options.controller);
    close(fd);  // the kernel removes the adapter
    return 0;
}

int main(int argc, char** argv) {
    for (int i = 1; i < argc; ++i) {
        if (strcmp(argv[i], "--help") == 0 || strcmp(argv[i], "-h") == 0) {
            usage(stdout);
            return 0;
        }
    }
    SimServerOptions options;
    if (!parse_args(argc, argv, &options)) {
        fprintf(stderr, "halvenor-sim: run 'halvenor-sim --help' for the options\n");
        return 2;
    }
    if (pipe2(stop_pipe, O_CLOEXEC) == -1) {
        perror("halvenor-sim: pipe");
        return 1;
    }
    signal(SIGPIPE, SIG_IGN);
    signal(SIGINT, on_signal);
    signal(SIGTERM, on_signal);

    std::string where, why;
    if (!options.vhci.empty()) return serve_vhci(options);
    int listen_fd = sim_server_listen(options, &where, &why);
    if (listen_fd == -1) {
        fprintf(stderr, "halvenor-sim: %s\n", why.c_str());
        return 1;
    }
    printf("listening on %s\n", where.c_str());
    fflush(stdout);
    sim_server_run(listen_fd, stop_pipe[0], options.controller);
    close(listen_fd);
    if (!options.unix_path.empty()) unlink(options.unix_path.c_str());
    return 0;
}
