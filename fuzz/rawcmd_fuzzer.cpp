// Fuzz target for command framing: token lists (cmd_rawcmd) and binary
// fields (hci_send_cmd, hci_send_cmd_rawcmd) from fuzz data. The bytes that
// reach the socket must equal an independent reference framing, or be
// nothing where the command cannot be framed.
#include <sys/socket.h>
#include <unistd.h>

#include <climits>
#include <cstdint>
#include <string>
#include <vector>

#include "engine/hci_cmd.h"
#include "fuzz/fuzz_check.h"
#include "tests/support/log_capture.h"

using Bytes = std::vector<uint8_t>;

namespace {

// Keeps the library's many lines off stderr and lets the checks look them up.
LogCapture g_log;

const int kMaxParams = 252;  // 4 header bytes + 252 fill the 256-byte packet area

bool is_space(char c) { return c == ' ' || (c >= '\t' && c <= '\r'); }

int hex_digit(char c) {
    if (c >= '0' && c <= '9') return c - '0';
    if (c >= 'a' && c <= 'f') return c - 'a' + 10;
    if (c >= 'A' && c <= 'F') return c - 'A' + 10;
    return -1;
}

// Base-16 conversion as C's strtol defines it in the "C" locale: leading
// white space, a sign, an optional 0x prefix, digits up to the first
// non-digit; out-of-range values clamp to LONG_MAX or LONG_MIN.
long reference_strtol16(const std::string& t) {
    size_t i = 0;
    while (i < t.size() && is_space(t[i])) ++i;
    bool negative = false;
    if (i < t.size() && (t[i] == '+' || t[i] == '-')) negative = t[i++] == '-';
    bool prefix = i + 2 < t.size() && t[i] == '0' && (t[i + 1] == 'x' || t[i + 1] == 'X');
    if (prefix && hex_digit(t[i + 2]) >= 0) i += 2;
    const unsigned long long limit = negative ? 1ULL + LONG_MAX : static_cast<unsigned long long>(LONG_MAX);
    unsigned long long magnitude = 0;
    bool clamped = false;
    for (; i < t.size() && hex_digit(t[i]) >= 0; ++i) {
        if (magnitude > (limit - hex_digit(t[i])) / 16) clamped = true;
        if (!clamped) magnitude = magnitude * 16 + hex_digit(t[i]);
    }
    if (clamped) return negative ? LONG_MIN : LONG_MAX;
    return negative ? static_cast<long>(0ULL - magnitude) : static_cast<long>(magnitude);
}

// 01, opcode (OGF in the upper 6 bits, OCF in the lower 10) low byte first,
// parameter length, parameters (Core Specification Vol 4, Part E, 5.4.1).
Bytes reference_frame(uint16_t ogf, uint16_t ocf, const Bytes& params) {
    uint16_t opcode = static_cast<uint16_t>(((ogf & 0x3F) << 10) | (ocf & 0x3FF));
    Bytes packet = {0x01, static_cast<uint8_t>(opcode & 0xFF), static_cast<uint8_t>(opcode >> 8),
                    static_cast<uint8_t>(params.size())};
    packet.insert(packet.end(), params.begin(), params.end());
    return packet;
}

std::vector<std::string> split_tokens(const uint8_t* data, size_t size) {
    std::vector<std::string> tokens(1);
    for (size_t i = 0; i < size; ++i) {
        if (data[i] == 0) tokens.emplace_back();
        else tokens.back().push_back(static_cast<char>(data[i]));
    }
    return tokens;
}

Bytes drain(int fd) {
    Bytes got;
    uint8_t buf[512];
    ssize_t n;
    while ((n = recv(fd, buf, sizeof(buf), MSG_DONTWAIT)) > 0) got.insert(got.end(), buf, buf + n);
    return got;
}

// Token form; `argc` may be smaller than the tokens present.
Bytes run_tokens(int fd, const std::vector<std::string>& tokens, int* rc) {
    std::vector<const char*> argv;
    for (const auto& t : tokens) argv.push_back(t.c_str());
    int argc = static_cast<int>(argv.size());
    *rc = cmd_rawcmd(fd, argc, argv.data()).status;
    if (argc < 3 || argc - 3 > kMaxParams) return {};
    Bytes params;
    for (int i = 3; i < argc; ++i) params.push_back(static_cast<uint8_t>(reference_strtol16(tokens[i])));
    return reference_frame(static_cast<uint16_t>(reference_strtol16(tokens[1])),
                           static_cast<uint16_t>(reference_strtol16(tokens[2])), params);
}

// Binary forms: OGF, OCF (16 bits each, low byte first), length, parameters.
Bytes run_binary(int fd, bool with_reply, const uint8_t* data, size_t size, int* rc) {
    if (size < 6) return {};
    uint16_t ogf = static_cast<uint16_t>(data[0] | (data[1] << 8));
    uint16_t ocf = static_cast<uint16_t>(data[2] | (data[3] << 8));
    uint8_t plen = data[4];
    bool absent = data[5] == 0xFF;  // no parameter buffer at all
    char params[256] = {0};
    for (size_t i = 0; i < plen && 6 + i < size; ++i) params[i] = static_cast<char>(data[6 + i]);
    *rc = with_reply ? hci_send_cmd_rawcmd(fd, ogf, ocf, plen, absent ? nullptr : params)
                     : hci_send_cmd(fd, ogf, ocf, plen, absent ? nullptr : params);
    if (absent && plen > 0) return {};
    return reference_frame(ogf, ocf, Bytes(params, params + plen));
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size < 1) return 0;
    int fds[2];
    FUZZ_CHECK(socketpair(AF_UNIX, SOCK_STREAM, 0, fds) == 0, "socketpair");
    // No reply will come: the reply-reading forms see the end of the stream.
    shutdown(fds[1], SHUT_WR);
    g_log.clear();

    int rc = -2;
    Bytes want;
    int mode = data[0] % 3;
    if (mode == 0) want = run_tokens(fds[0], split_tokens(data + 1, size - 1), &rc);
    else want = run_binary(fds[0], mode == 2, data + 1, size - 1, &rc);

    Bytes got = drain(fds[1]);
    FUZZ_CHECK(got == want, "%zu bytes written, %zu expected", got.size(), want.size());
    if (rc != -2) {
        // Only the plain binary form with no reply to read succeeds here.
        int expected_rc = mode == 1 && !want.empty() ? 0 : -1;
        FUZZ_CHECK(rc == expected_rc, "result %d, expected %d", rc, expected_rc);
    }
    close(fds[0]);
    close(fds[1]);
    return 0;
}
