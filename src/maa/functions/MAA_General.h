// The Java side of the shell: the general function that receives every call of
// an unregistered name, and the runUsbFunctionCall bridge it shares with the
// forwarded families.
#pragma once

#include <string>

#include "maa/MAA_Types.h"

// Registered through MAA_SymbolAddGeneral (target 1, kind 4, 2 parameters).
// Returns no record (nullptr) for more than 10 arguments, a text argument over
// 100 characters, or when the Java array cannot be made.
TMAAResult *MAA_GENERAL_FUNCTION(U32 argc, U32 *args);

// Argument words up to this bound are numbers, those above it text addresses.
constexpr U32 MAA_GENERAL_NUMBER_LIMIT = 1000000;
// Buffer of one argument text: a text of more than this many characters is
// refused; one of exactly this many is cut to fit the buffer with its NUL.
constexpr U32 MAA_GENERAL_ARG_SIZE = 100;
// The text the Java side receives for one argument word: a number in decimal,
// or the text at the address with "%%" read as "%" (any other '%' stays as it
// stands: a host's text is never a format that consumes arguments). False
// (logged) for a refused address or a text over MAA_GENERAL_ARG_SIZE characters.
bool MAA_UsbFunctionArgText(U32 ulWord, char (&aubText)[MAA_GENERAL_ARG_SIZE]);

enum class TMAAJavaCall {
    Reply,     // *reply holds the Java reply
    NoReply,   // no Java environment or object, no method, or no reply (logged)
    BadArgs,   // more than 10 arguments or a text over 100 characters
};
// Calls "runUsbFunctionCall" on globalMAAObj with `id` and the argument words
// converted as the general function converts them (a word above 1000000 is
// the address of a text, the others are numbers).
TMAAJavaCall MAA_CallUsbFunction(const char *id, U32 argc, const U32 *args, std::string *reply);
// Reports a runUsbFunctionCall reply by its prefix ("idpt:" line by line,
// "spider:" the text from its eighth character, anything else whole) and
// returns the final record.
TMAAResult *MAA_ReportUsbFunctionReply(const std::string &reply);
// Reports `text` line by line through a 64-byte line buffer: each line with
// mode 0 (its last character, the one before the line feed, is not sent), the
// last with mode 1; the whole text with mode 1 when it holds no line feed.
// Returns the final record.
TMAAResult *MAA_ReportLines(const char *text);
