// A bad command line: the message names the argument and its valid values.
package com.quorvex.halvenor.console;

final class UsageException extends Exception {
    private static final long serialVersionUID = 1L;

    UsageException(String message) {
        super(message);
    }
}
