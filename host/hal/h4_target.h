// Where an H4 controller is and how to reach it: parsing the unix:, tcp:,
// tty: and hci: values of HALVENOR_HCI, and opening a non-blocking descriptor
// to the controller. Any thread.
#pragma once

#include <netdb.h>

#include <string>

struct H4Target {
    enum Kind { UNIX, TCP, TTY, USER } kind;  // USER: an adapter's HCI user channel
    std::string text;  // as given, for log lines
    std::string path;  // socket path, host name or device
    int port = 0;   // TCP port, or the adapter index of hci:N
    int baud = 115200;
    bool rtscts = false;  // hardware flow control on a serial line
};

// Parses "unix:PATH", "tcp:HOST:PORT", "tty:DEVICE[,BAUD][,rtscts]" or "hci:N". On failure
// returns false with the reason in *why.
bool parse_h4_target(const std::string& value, H4Target* target, std::string* why);

// Opens a non-blocking descriptor to the controller, giving up after 3 s (name
// resolution and connect alike) or when `wake` becomes readable; -1 with the
// reason in *why.
int connect_h4_target(const H4Target& target, int wake, std::string* why);

// Waits for `events` on fd or for the wake descriptor; false on time-out
// (-1: none), wake-up or error, with *why set.
bool h4_wait_for(int fd, short events, int wake, int timeout_ms, std::string* why);

// Host tests: the name resolver behind tcp:HOST:PORT (getaddrinfo by default).
using H4Resolver = int (*)(const char* host, const char* port, const struct addrinfo* hints,
                           struct addrinfo** found);
void h4_use_resolver(H4Resolver resolver);
