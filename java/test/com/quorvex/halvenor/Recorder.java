// A listener that records the library's callbacks in the order they arrive.
package com.quorvex.halvenor;

import java.util.ArrayList;
import java.util.List;

public final class Recorder implements TestModeUtils.Listener {
    private final List<String> events = new ArrayList<>();

    @Override
    public synchronized void onReceivedTestData(int packets) {
        events.add("count " + packets);
    }

    @Override
    public synchronized void onSendCmdSuccess(int code) {
        events.add("sent " + code);
    }

    /** The callbacks since the last call, oldest first. */
    public synchronized List<String> take() {
        List<String> out = List.copyOf(events);
        events.clear();
        return out;
    }
}
