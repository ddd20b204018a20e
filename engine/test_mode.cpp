// Test procedures and their command tables: DUT mode entry and exit, LE direct
// tests selected by a test command code, and the continuous-wave command.
// Run on the Java thread of the calling native method, one at a time.
#include "engine/test_mode.h"

#include <poll.h>
#include <stdio.h>

#include "engine/hci_cmd.h"
#include "jni/binding.h"
#include "transport/log.h"
#include "transport/session.h"

// LE Transmitter Test (OGF 0x08, OCF 0x001E): channel, 37 payload bytes, pattern 0.
static const char* const kTxCh0[] = {"rawcmd", "0x08", "0x001E", "0x00", "0x25", "0x00"};
static const char* const kTxCh19[] = {"rawcmd", "0x08", "0x001E", "0x13", "0x25", "0x00"};
static const char* const kTxCh39[] = {"rawcmd", "0x08", "0x001E", "0x27", "0x25", "0x00"};
// LE Enhanced Transmitter Test (OCF 0x0034): the same on the LE 2M PHY.
static const char* const kTxCh0Phy2M[] = {"rawcmd", "0x08", "0x0034", "0x00", "0x25", "0x00", "0x02"};
static const char* const kTxCh19Phy2M[] = {"rawcmd", "0x08", "0x0034", "0x13", "0x25", "0x00", "0x02"};
static const char* const kTxCh39Phy2M[] = {"rawcmd", "0x08", "0x0034", "0x27", "0x25", "0x00", "0x02"};
// LE Receiver Test (OCF 0x001D): channel.
static const char* const kRxCh0[] = {"rawcmd", "0x08", "0x001D", "0x00"};
static const char* const kRxCh19[] = {"rawcmd", "0x08", "0x001D", "0x13"};
static const char* const kRxCh39[] = {"rawcmd", "0x08", "0x001D", "0x27"};
// LE Enhanced Receiver Test (OCF 0x0033): channel, LE 2M PHY, standard modulation index.
static const char* const kRxCh0Phy2M[] = {"rawcmd", "0x08", "0x0033", "0x00", "0x02", "0x00"};
static const char* const kRxCh19Phy2M[] = {"rawcmd", "0x08", "0x0033", "0x13", "0x02", "0x00"};
static const char* const kRxCh39Phy2M[] = {"rawcmd", "0x08", "0x0033", "0x27", "0x02", "0x00"};
// LE Test End (OCF 0x001F): its Command Complete carries the received-packet count.
static const char* const kTestEnd[] = {"rawcmd", "0x08", "0x001F"};

#define TOKENS(list) list, static_cast<int>(sizeof(list) / sizeof(list[0]))

static const int kTestEndCode = 3000;

struct BleTest {
    int code;  // 1xxxx transmitter, 2xxxx receiver, xxxx the channel's centre frequency in MHz
    const char* const* plain;
    int plain_count;
    const char* const* phy2m;
    int phy2m_count;
};

static const BleTest kBleTests[] = {
        {kTestEndCode, TOKENS(kTestEnd), TOKENS(kTestEnd)},
        {12402, TOKENS(kTxCh0), TOKENS(kTxCh0Phy2M)},
        {12440, TOKENS(kTxCh19), TOKENS(kTxCh19Phy2M)},
        {12480, TOKENS(kTxCh39), TOKENS(kTxCh39Phy2M)},
        {22402, TOKENS(kRxCh0), TOKENS(kRxCh0Phy2M)},
        {22440, TOKENS(kRxCh19), TOKENS(kRxCh19Phy2M)},
        {22480, TOKENS(kRxCh39), TOKENS(kRxCh39Phy2M)},
};

// Vendor continuous-wave transmit (OGF 0x3F, OCF 0x0004); tokens 4 to 6 are
// the channel, power and type of each call.
static const char* const kCwTemplate[] = {"rawcmd", "0x3F", "0x0004", "0x05", "", "", "",
                                          "0x20", "0x00", "0x00", "0x00", "0x00"};
static const int kCwTokens = 12;
// "0x" and two hexadecimal digits.
static const int kCwFieldSize = 5;

struct DutCommand {
    uint16_t ogf;
    uint16_t ocf;
    uint8_t plen;
    char params[3];
    // Off by default, and dropped by newer controllers (Write Encryption
    // Mode is deprecated): a refusal does not keep the device out of the mode.
    bool may_refuse;
};

// Device Under Test entry, in order (Core Specification Vol 4, Part E, 7.6.3,
// 7.3.3, 7.3.18, 7.3.24, 7.3.26).
static const DutCommand kDutEntry[] = {
        {0x06, 0x0003, 0, {0}, false},        // Enable Device Under Test Mode
        {0x03, 0x0005, 3, {2, 0, 2}, false},  // Set Event Filter: auto-accept all connections
        {0x03, 0x001A, 1, {3}, false},        // Write Scan Enable: inquiry and page scan
        {0x03, 0x0020, 1, {0}, true},         // Write Authentication Enable: off
        {0x03, 0x0022, 1, {0}, true},         // Write Encryption Mode: off
};

static const BleTest* find_ble_test(int code) {
    for (const BleTest& test : kBleTests) {
        if (test.code == code) return &test;
    }
    return nullptr;
}

// The tool end first: the pump sees the end of the stream and stops, then the
// session is closed behind it.
static void end_session() {
    hidl_client_close_tool_end();
    hidl_client_close();
}

// Once the bridge has ended (the HAL died, or the pump stopped) the session
// can carry nothing more.
static bool session_ended(int fd) {
    struct pollfd pfd = {fd, POLLRDHUP, 0};
    return poll(&pfd, 1, 0) == 1 && (pfd.revents & (POLLRDHUP | POLLHUP | POLLERR | POLLNVAL));
}

// Opens a HAL session into bt_fd unless one is open and alive; true when
// bt_fd is usable.
static bool ensure_session(const char* caller) {
    if (bt_fd >= 0 && session_ended(bt_fd)) {
        LOGE("%s: the controller session had ended, opening a new one", caller);
        end_session();
    }
    if (bt_fd < 0) hidl_client_init();
    return bt_fd >= 0;
}

void sendBleTestCommand(int code, uint8_t enhanced) {
    LOGI("sendBleTestCommand()");
    cmd_test_end_flag = 0;
    const BleTest* test = find_ble_test(code);
    if (test == nullptr) {
        LOGE("sendBleTestCommand, command not support return!!!");
        return;
    }
    if (code == kTestEndCode) cmd_test_end_flag = 1;
    if (!ensure_session("sendBleTestCommand")) {
        LOGE("sendBleTestCommand, init smd error return!!!");
        return;
    }
    LOGI("sendBleTestCommand, init smd successful");

    HciReply reply = enhanced != 0 ? cmd_rawcmd(bt_fd, test->phy2m_count, test->phy2m)
                                   : cmd_rawcmd(bt_fd, test->plain_count, test->plain);
    // The flag belongs to this exchange only: a test end that was refused or
    // never answered must not turn the next command's reply into a count.
    cmd_test_end_flag = 0;
    if (reply.status == HCI_NOT_ANSWERED) {
        LOGE("sendBleTestCommand, command %d not answered return!!!", code);
        return;
    }
    if (reply.status != 0) {
        LOGE("sendBleTestCommand, command %d (opcode 0x%04x) refused with status 0x%02x return!!!",
             code, reply.opcode, reply.status);
        return;
    }
    onSendCmdSuccess(code);
}

static bool fits_byte(jint value) { return value >= 0 && value <= 0xFF; }

void sendCwtxCommandNative(JNIEnv*, jobject, jint channel, jint power, jint type) {
    LOGI("sendCwtxCommandNative channel= %d, power= %d, type= %d", channel, power, type);
    if (!fits_byte(channel) || !fits_byte(power) || !fits_byte(type)) {
        LOGE("sendCwtxCommandNative, channel, power and type must be 0 to 255 return!!!");
        return;
    }
    if (!ensure_session("sendCwtxCommandNative")) {
        LOGE("init bt_fd error return!!!");
        return;
    }
    LOGI("init bt_fd successful");

    char fields[3][kCwFieldSize];
    const jint values[3] = {channel, power, type};
    const char* tokens[kCwTokens];
    for (int i = 0; i < kCwTokens; ++i) tokens[i] = kCwTemplate[i];
    for (int i = 0; i < 3; ++i) {
        snprintf(fields[i], sizeof(fields[i]), "0x%x", static_cast<unsigned>(values[i]));
        tokens[4 + i] = fields[i];
    }
    HciReply reply = cmd_rawcmd(bt_fd, kCwTokens, tokens);
    if (reply.status == HCI_NOT_ANSWERED) {
        LOGE("sendCwtxCommandNative, command 0x%04x not answered return!!!", reply.opcode);
    } else if (reply.status != 0) {
        LOGE("sendCwtxCommandNative, command 0x%04x refused with status 0x%02x return!!!",
             reply.opcode, reply.status);
    }
}

// Sends one command of the entry; false when the entry cannot go on.
static bool enter_step(const DutCommand& cmd) {
    char params[sizeof(cmd.params)];
    for (size_t i = 0; i < sizeof(params); ++i) params[i] = cmd.params[i];
    HciReply reply = hci_cmd_exchange(bt_fd, cmd.ogf, cmd.ocf, cmd.plen, params);
    if (reply.status == HCI_NOT_ANSWERED) {
        LOGE("enterTestMode, command 0x%04x not answered return!!!", reply.opcode);
        return false;
    }
    if (reply.status == 0) return true;
    if (cmd.may_refuse) {
        LOGI("enterTestMode, command 0x%04x refused with status 0x%02x, not needed, going on",
             reply.opcode, reply.status);
        return true;
    }
    LOGE("enterTestMode, command 0x%04x refused with status 0x%02x return!!!", reply.opcode,
         reply.status);
    return false;
}

int hci_enable_device_under_test_mode() {
    LOGI("enterTestMode, hci_enable_device_under_test_mode IN.\n");
    if (!ensure_session("enterTestMode")) {
        LOGE("init bt_fd error return!!!");
        return -1;
    }
    LOGI("init bt_fd successful");
    LOGE("start send com to bt device!!!\n");

    for (const DutCommand& cmd : kDutEntry) {
        if (enter_step(cmd)) continue;
        // Half an entry is no mode: the controller is reset (it may not answer)
        // and the session ended, so -1 always means neither is left.
        hci_cmd_exchange(bt_fd, 0x03, 0x0003, 0, nullptr);
        end_session();
        return -1;
    }
    LOGI("enterTestMode, hci_enable_device_under_test_mode OUT!!!\n");
    return 0;
}

int hci_disable_device_under_test_mode() {
    LOGE("quitTestMode, hci_disable_device_under_test_mode IN.\nbt_fd = %d", bt_fd);
    hci_send_cmd_rawcmd(bt_fd, 0x03, 0x0003, 0, nullptr);
    end_session();
    LOGI("quitTestMode, hci_disable_device_under_test_mode OUT!!!\n");
    return 0;
}
