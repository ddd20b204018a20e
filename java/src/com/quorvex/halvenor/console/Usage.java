// The console's help text.
package com.quorvex.halvenor.console;

final class Usage {
    private Usage() {}

    static final String TEXT = """
        usage: ./halvenor [global options] COMMAND [options]

        Commands:
          demo                      tour against the controller: Device Under Test mode on and off,
                                    a sweep of 0.5 s receiver tests with their PER, a continuous wave
          dut on [--hold S]         enter classic Device Under Test mode; with --hold, stay in it
                                    for S seconds, then leave it with an HCI Reset
          dut off                   leave Device Under Test mode (HCI Reset)
          tx --freq F --phy P [--duration S]
                                    LE transmitter test for S seconds (default 1), then LE Test End
          rx --freq F --phy P [--duration S] [--expected N] [--window S]
                                    LE receiver test: packets received, expected and PER with its
                                    95 % confidence interval
          sweep [rx|tx] [--duration S] [--expected N] [--window S]
                                    the test on every frequency and PHY, S seconds each (default rx)
          cw --channel C --power P --type T [--duration S]
                                    vendor continuous-wave transmission for S seconds (default 1),
                                    then an HCI Reset
          help                      this text

        Options:
          --freq F        2402 (channel 0), 2440 (channel 19) or 2480 (channel 39), in MHz
          --phy P         1M or 2M
          --duration S    seconds, e.g. 2, 0.5 or 500ms
          --expected N    packets the tester sent during the whole run (default: the run's length
                          divided by the 625 us packet interval, as from a reference transmitter)
          --window S      longest receiver window, at most 40 (default 30): longer runs are split
                          into windows and summed, so the controller's 16-bit count never wraps
          --channel C, --power P, --type T
                          bytes of the continuous-wave command, 0 to 255 (or 0x00 to 0xff)

        Global options:
          --hci sim|unix:PATH|tcp:HOST:PORT|tty:DEVICE[,BAUD]
                          the controller (default: $HALVENOR_HCI, else sim, the simulated one)
          --btsnoop FILE  record every HCI packet in FILE (btsnoop, opens in Wireshark)
          --verbose       show the library's log lines
          --json          print the results as one JSON object

        Exit status: 0 when every step succeeded, 1 when one failed, 2 for a bad command line,
        130 when interrupted (the running test is ended first).
        """;
}
