// A controller on a pseudo-terminal, for the console's tests of a serial line: prints the
// line's name, answers every H4 command with a Command Complete (status 0x00; LE Test End
// with 100 packets), and once it has answered the command named by --hold-after, holds the
// line's flow control, as a UART's CTS held low does: nothing more gets through to it.
// Runs until killed.
#include <fcntl.h>
#include <stdio.h>
#include <stdlib.h>
#include <termios.h>
#include <unistd.h>

#include <cstdint>
#include <vector>

static bool read_exactly(int fd, uint8_t* buf, size_t len) {
    for (size_t done = 0; done < len;) {
        ssize_t n = read(fd, buf + done, len - done);
        if (n <= 0) return false;
        done += static_cast<size_t>(n);
    }
    return true;
}

int main(int argc, char** argv) {
    long hold_after = argc == 3 ? strtol(argv[2], nullptr, 16) : -1;
    int master = posix_openpt(O_RDWR | O_NOCTTY);
    if (master < 0 || grantpt(master) != 0 || unlockpt(master) != 0) return 1;
    // Kept open, so the line lives between the console's sessions; flow control is held on it.
    int line = open(ptsname(master), O_RDWR | O_NOCTTY);
    struct termios raw;
    tcgetattr(line, &raw);
    cfmakeraw(&raw);
    tcsetattr(line, TCSANOW, &raw);
    printf("%s\n", ptsname(master));
    fflush(stdout);
    uint8_t head[4];
    while (read_exactly(master, head, 4)) {
        std::vector<uint8_t> params(head[3]);
        if (!read_exactly(master, params.data(), params.size())) break;
        int opcode = head[1] | (head[2] << 8);
        std::vector<uint8_t> reply = {0x04, 0x0E, 0x04, 0x01, head[1], head[2], 0x00};
        if (opcode == 0x201F) reply = {0x04, 0x0E, 0x06, 0x01, head[1], head[2], 0x00, 100, 0x00};
        if (write(master, reply.data(), reply.size()) != static_cast<ssize_t>(reply.size())) break;
        if (opcode == hold_after) tcflow(line, TCOOFF);
    }
    return 0;
}
