// The console's help: an overview, and a page per command ("./halvenor help rx", "rx --help").
package com.quorvex.halvenor.console;

import java.util.Map;

final class Usage {
    private Usage() {}

    private static final String COMMANDS = """
        usage: ./halvenor [global options] COMMAND [options]

        Commands (./halvenor help COMMAND for one of them):
          demo                      tour: Device Under Test mode on and off, 0.5 s receiver tests on
                                    every frequency and PHY with their PER, a continuous wave
          dut on [--hold S]         enter classic Device Under Test mode
          dut off                   leave Device Under Test mode (HCI Reset)
          tx --freq F --phy P [--duration S]
                                    LE transmitter test
          rx --freq F --phy P [--duration S] [--expected N] [--window S]
                                    LE receiver test: packets received, expected, PER
          sweep [rx|tx] [--duration S] [--expected N] [--window S]
                                    the test on every frequency and PHY
          cw --channel C --power P --type T [--duration S]
                                    vendor continuous-wave transmission
          sim [--unix PATH | --tcp PORT] [--reftx 0|1] [--loss FRACTION]
                                    a simulated controller for other processes (halvenor-sim)
          help [COMMAND]            this text, or a command's page
        """;

    private static final String OUTCOME = """
        A step is ok when the controller accepted every command of it (Command Complete or
        Command Status with status 0x00); a refused or unanswered command fails the step, with
        the command, its opcode and the status.
        Exit status: 0 when every step succeeded, 1 when one failed, 2 for a bad command line,
        129, 130 or 143 when stopped by SIGHUP, SIGINT (Ctrl-C) or SIGTERM (the running test is
        ended first).
        """;

    private static final Map<String, String> PAGES = Map.of(
            "demo", """
                usage: ./halvenor demo
                Device Under Test mode on, then off; a 0.5 s receiver test on 2402, 2440 and 2480 MHz,
                each on LE 1M and LE 2M, with packets received, expected and PER; the continuous-wave
                command (channel 1, power 9, type 4) for 0.5 s, stopped with an HCI Reset.
                """,
            "dut on", """
                usage: ./halvenor dut on [--hold S]
                Enters classic Device Under Test mode: Enable Device Under Test Mode, Set Event Filter
                (auto-accept all connections), Write Scan Enable (inquiry and page scan), Write
                Authentication Enable (off), Write Encryption Mode (off); the last two may be refused.
                The controller stays in the mode for a tester, until `./halvenor dut off`.
                  --hold S        stay S seconds (e.g. 2, 0.5 or 500ms), then leave the mode with an HCI Reset
                """,
            "dut off", """
                usage: ./halvenor dut off
                Leaves Device Under Test mode with an HCI Reset (also ends any test left running).
                """,
            "tx", """
                usage: ./halvenor tx --freq F --phy P [--duration S]
                LE transmitter test (37-byte payload, pattern 0x00) for S seconds, then LE Test End.
                  --freq F        2402, 2440 or 2480 (MHz; LE channels 0, 19 and 39)
                  --phy P         1M or 2M (2M uses the enhanced test command)
                  --duration S    seconds, e.g. 2, 0.5 or 500ms (default 1)
                """,
            "rx", """
                usage: ./halvenor rx --freq F --phy P [--duration S] [--expected N] [--window S]
                LE receiver test for S seconds: packets received (the controller's LE Test End count),
                expected, and the packet error rate with its 95 % confidence interval.
                  --freq F        2402, 2440 or 2480 (MHz; LE channels 0, 19 and 39)
                  --phy P         1M or 2M (2M uses the enhanced test command)
                  --duration S    seconds, e.g. 2, 0.5 or 500ms (default 1)
                  --expected N    packets the tester sent during the whole run (default: the run's length
                                  over the 625 us packet interval, as from a transmitter sending without pause)
                  --window S      longest window, 1 to 40 s (default 30): longer runs are split into windows
                                  and summed, so the controller's 16-bit count never wraps
                """,
            "sweep rx", """
                usage: ./halvenor sweep [rx] [--duration S] [--expected N] [--window S]
                The receiver test on every frequency and PHY, S seconds each (default 1), with the options
                of rx (--expected counts per step). A step that fails does not stop the sweep.
                """,
            "sweep tx", """
                usage: ./halvenor sweep tx [--duration S]
                The transmitter test on every frequency and PHY, S seconds each (default 1).
                """,
            "cw", """
                usage: ./halvenor cw --channel C --power P --type T [--duration S]
                The vendor continuous-wave command (0xFC04) with the three bytes given, held for S seconds
                (default 1), then an HCI Reset to stop the carrier.
                  --channel C, --power P, --type T
                                  0 to 255, decimal or 0x00 to 0xff
                """);

    private static String globals() {
        return """
            Global options:
              --hci sim|unix:PATH|tcp:HOST:PORT|tty:DEVICE[,BAUD][,rtscts]
                              the controller (default: $HALVENOR_HCI, else sim, the simulated one);
                              rtscts turns on hardware flow control on a serial line
              --btsnoop FILE  also record every HCI packet in FILE (btsnoop, opens in Wireshark);
                              an existing capture is appended to
              --trace         print each HCI command and event as it passes, decoded
              --verbose       show the library's log lines
              --json          print the results as one JSON object
              -h, --help      help (after a command: that command's page)""";
    }

    /** The overview, or the page of `command`. */
    static String text(String command) {
        if (command == null) {
            return COMMANDS + "\n" + globals() + "\n\n" + OUTCOME;
        }
        return PAGES.get(command) + "\n" + globals() + "\n";
    }
}
