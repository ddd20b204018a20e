// IBluetoothHci over H4 on a stream: a unix or TCP socket, or a serial line.
// A reader thread per session connects, reports initializationComplete and
// delivers the controller's packets; any thread may send.
#pragma once

#include <string>

#include <android/hardware/bluetooth/1.0/IBluetoothHci.h>

struct H4Target {
    enum Kind { UNIX, TCP, TTY } kind;
    std::string text;  // as given, for log lines
    std::string path;  // socket path, host name or device
    int port = 0;
    int baud = 115200;
    bool rtscts = false;  // hardware flow control on a serial line
};

// Parses "unix:PATH", "tcp:HOST:PORT" or "tty:DEVICE[,BAUD][,rtscts]". On failure
// returns false with the reason in *why.
bool parse_h4_target(const std::string& value, H4Target* target, std::string* why);

android::sp<android::hardware::bluetooth::V1_0::IBluetoothHci> create_h4_hci(const H4Target& target);
