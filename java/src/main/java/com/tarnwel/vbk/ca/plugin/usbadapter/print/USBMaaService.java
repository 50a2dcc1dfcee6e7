package com.tarnwel.vbk.ca.plugin.usbadapter.print;

import java.util.Map;
import java.util.concurrent.ConcurrentHashMap;
import java.util.function.Function;

/**
 * The test shell's general functions: every command name the shell does not
 * know itself comes here as "runUsbFunctionCall" with its arguments as texts.
 * A reply starting "idpt:" is sent line by line, one starting "spider:" without
 * the prefix, anything else whole; null makes the shell report a failure.
 */
public class USBMaaService {
    private final Map<String, Function<String[], String>> functions = new ConcurrentHashMap<>();

    public USBMaaService() {
        register("SetUIEnable", args -> "SetUIEnable = OK");
    }

    /** Serves {@code functionId} with {@code function} from now on. */
    public void register(String functionId, Function<String[], String> function) {
        functions.put(functionId, function);
    }

    public String runUsbFunctionCall(String functionId, String[] args) {
        Function<String[], String> function = functions.get(functionId);
        return function == null ? null : function.apply(args);
    }
}
