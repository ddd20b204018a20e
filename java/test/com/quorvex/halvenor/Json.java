// A small JSON reader for checking the console's --json output: objects become maps,
// arrays lists, numbers doubles. Fails on anything that is not strict JSON.
package com.quorvex.halvenor;

import java.util.ArrayList;
import java.util.LinkedHashMap;
import java.util.List;
import java.util.Map;

public final class Json {
    private final String text;
    private int at;

    private Json(String text) {
        this.text = text;
    }

    public static Object parse(String text) {
        Json j = new Json(text);
        Object v = j.value();
        j.space();
        if (j.at != text.length()) {
            throw j.error("trailing text");
        }
        return v;
    }

    private Object value() {
        space();
        if (at >= text.length()) {
            throw error("value expected");
        }
        char c = text.charAt(at);
        switch (c) {
            case '{': return object();
            case '[': return array();
            case '"': return string();
            default:
                if (text.startsWith("true", at)) { at += 4; return true; }
                if (text.startsWith("false", at)) { at += 5; return false; }
                if (text.startsWith("null", at)) { at += 4; return null; }
                return number();
        }
    }

    private Map<String, Object> object() {
        Map<String, Object> m = new LinkedHashMap<>();
        at++;
        space();
        if (peek('}')) {
            return m;
        }
        do {
            space();
            String key = string();
            space();
            expect(':');
            m.put(key, value());
            space();
        } while (peek(','));
        expect('}');
        return m;
    }

    private List<Object> array() {
        List<Object> l = new ArrayList<>();
        at++;
        space();
        if (peek(']')) {
            return l;
        }
        do {
            l.add(value());
            space();
        } while (peek(','));
        expect(']');
        return l;
    }

    private String string() {
        expect('"');
        StringBuilder b = new StringBuilder();
        while (at < text.length() && text.charAt(at) != '"') {
            char c = text.charAt(at++);
            if (c == '\\') {
                char e = text.charAt(at++);
                switch (e) {
                    case 'n': b.append('\n'); break;
                    case 't': b.append('\t'); break;
                    case 'u': b.append((char) Integer.parseInt(text.substring(at, at + 4), 16)); at += 4; break;
                    default: b.append(e);
                }
            } else if (c < 0x20) {
                throw error("control character in string");
            } else {
                b.append(c);
            }
        }
        expect('"');
        return b.toString();
    }

    private Double number() {
        int start = at;
        while (at < text.length() && "+-0123456789.eE".indexOf(text.charAt(at)) >= 0) {
            at++;
        }
        String n = text.substring(start, at);
        if (!n.matches("-?(0|[1-9][0-9]*)(\\.[0-9]+)?([eE][+-]?[0-9]+)?")) {
            throw error("bad number '" + n + "'");
        }
        return Double.valueOf(n);
    }

    private void space() {
        while (at < text.length() && Character.isWhitespace(text.charAt(at))) {
            at++;
        }
    }

    private boolean peek(char c) {
        if (at < text.length() && text.charAt(at) == c) {
            at++;
            return true;
        }
        return false;
    }

    private void expect(char c) {
        if (!peek(c)) {
            throw error("'" + c + "' expected");
        }
    }

    private IllegalArgumentException error(String what) {
        return new IllegalArgumentException(what + " at " + at + " in " + text);
    }
}
