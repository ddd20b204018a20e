// Takes an adapter's HCI user channel the way the host HAL does, and prints
// "ok" or why it could not, in the words the console shows: the user-channel
// test checks each refusal against a real kernel with it.
//   hci_user_probe [--hold] INDEX   (--hold: keep it until SIGTERM)
#include <signal.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <unistd.h>

#include <string>

#include "host/hal/hci_user.h"

int main(int argc, char** argv) {
    bool hold = argc == 3 && strcmp(argv[1], "--hold") == 0;
    if (argc != 2 && !hold) {
        fprintf(stderr, "usage: hci_user_probe [--hold] INDEX\n");
        return 2;
    }
    std::string why;
    int fd = hci_user_take(atoi(argv[argc - 1]), -1, &why);
    printf("%s\n", fd == -1 ? why.c_str() : "ok");
    fflush(stdout);
    if (fd != -1 && hold) pause();
    return 0;
}
