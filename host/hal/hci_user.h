// An adapter of this machine's kernel, reached through its HCI user channel:
// exclusive raw access, one H4 packet per read and per write, type byte
// first. The channel is bound once and kept for the life of the process, so
// that the system's Bluetooth service cannot take the adapter back between
// sessions. Any thread.
#pragma once

#include <string>

// A descriptor of its own (non-blocking) on adapter `index`'s user channel,
// bound now or earlier; -1 with the cause and what to do about it in *why.
// The kernel's own setup of a new adapter (EBUSY) is waited out for up to
// 2 s, unless `wake` becomes readable.
int hci_user_take(int index, int wake, std::string* why);

// The adapter went away or stopped taking packets: the next take binds anew.
void hci_user_lost(int index);

// Host tests: what opens and binds adapter `index`'s user channel, returning
// a bound descriptor, or -1 with errno set. Null restores the kernel's.
using HciUserOpener = int (*)(int index);
void hci_user_use_opener(HciUserOpener opener);
