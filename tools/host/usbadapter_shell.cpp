// usbadapter-shell: a factory engineer's client for the printer's test shell.
// Opens a session on the printer's USB print channel (a printer-class device
// node such as /dev/usb/lp0), sends command lines and prints what the device
// answers. Plain open/read/write/poll on the path given: nothing else is
// assumed about the other side.
#include <fcntl.h>
#include <getopt.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <sstream>
#include <string>
#include <vector>

#include "MaaClient.h"

namespace {

const char kUsage[] =
    "usage: usbadapter-shell [options] DEVICE\n"
    "\n"
    "Talks to the printer's factory test shell over DEVICE, the printer's USB\n"
    "print channel (on a Linux host the printer-class node, e.g. /dev/usb/lp0).\n"
    "Opens a session (ESC w MAASTART), sends the command lines, prints every\n"
    "record the device sends back and stops the session (MAA-STOP).\n"
    "\n"
    "  -e, --exec LINE     send one command line (repeatable; in order with -s, -p)\n"
    "  -s, --script FILE   send the lines of FILE ('-': standard input)\n"
    "  -p, --put FILE      download FILE into a device buffer (same as the line\n"
    "                      \"!put FILE\"); later lines may use its address as $addr;\n"
    "                      a file of 4 GiB or more is refused (32-bit size field)\n"
    "      --auto          an auto session: the device saves the lines and runs\n"
    "                      them after the stop, answering nothing; its run ends\n"
    "                      at an empty line, so blank lines are dropped (a note\n"
    "                      on standard error says how many)\n"
    "  -o, --save DIR      directory for files the device sends (default .)\n"
    "  -w, --wait MS       silence that ends the output of a line that calls a\n"
    "                      function (default 2000)\n"
    "      --short-wait MS silence that ends the output of any other line\n"
    "                      (assignments, expressions; default 200)\n"
    "  -t, --timeout MS    bound of every answer the device owes (default 5000)\n"
    "      --raw           also print each frame in hex\n"
    "      --no-stop       leave the session open at the end\n"
    "  -h, --help          this text\n"
    "\n"
    "Without -e, -s or -p the lines come from standard input (\"maa> \" on a\n"
    "terminal). Output: \"| text\" for each record, \"= result N: text\" for the\n"
    "last record of a command, \"<file ...>\" for files (saved as upload-NNN.bin).\n"
    "Lines are sent as typed; the device cuts them at 1024 characters and takes\n"
    "the 8 bytes behind a '#' raw.\n"
    "\n"
    "Exit status: 0 done; 1 the device did not answer the start or stop, or the\n"
    "channel failed; 2 usage; 3 DEVICE could not be opened.\n";

struct Options {
    std::vector<std::string> lines;  // "!put FILE" for downloads
    bool fromStdin = false;
    bool autoMode = false;
    std::string saveDir = ".";
    int waitMs = 2000;
    int shortWaitMs = 200;
    int timeoutMs = 5000;
    bool raw = false;
    bool stop = true;
    std::string device;
};

int Usage(const std::string &message) {
    std::fprintf(stderr, "usbadapter-shell: %s\n(usbadapter-shell --help for the options)\n", message.c_str());
    return 2;
}

bool ReadLines(std::istream &in, std::vector<std::string> *lines) {
    for (std::string line; std::getline(in, line);) {
        if (!line.empty() && line.back() == '\r') line.pop_back();
        lines->push_back(line);
    }
    return true;
}

bool ReadAll(const std::string &path, std::string *out) {
    std::ifstream in(path, std::ios::binary);
    if (!in) return false;
    std::ostringstream all;
    all << in.rdbuf();
    *out = all.str();
    return true;
}

std::string Substitute(std::string line, const std::string &addr) {
    for (size_t at; !addr.empty() && (at = line.find("$addr")) != std::string::npos;) line.replace(at, 5, addr);
    return line;
}

class Shell {
public:
    Shell(maahost::Session &s, const Options &o) : s_(s), o_(o) {}

    void Print(const maahost::Frame &f) {
        std::string text = maahost::Describe(f);
        if (f.kind == maahost::Frame::Kind::File && !f.headerOnly) {
            char name[32];
            std::snprintf(name, sizeof name, "upload-%03d.bin", ++uploads_);
            const std::string path = o_.saveDir + "/" + name;
            std::ofstream(path, std::ios::binary).write(f.data.data(), static_cast<std::streamsize>(f.data.size()));
            text += " saved as " + path;
        }
        std::cout << text << "\n";
        if (o_.raw) std::cout << "  raw: " << maahost::Hex(s_.rawLog) << "\n";
        s_.rawLog.clear();
    }

    // false when the channel failed.
    bool Run(const std::string &typed) {
        const std::string line = Substitute(typed, addr_);
        if (line.rfind("!put ", 0) == 0) return Put(line.substr(5));
        if (line.size() > 1024) std::cerr << "warning: the device cuts lines at 1024 characters\n";
        // Only a function can take long to answer; other lines answer at once or never.
        const int wait = maahost::CallsFunction(line) ? o_.waitMs : std::min(o_.shortWaitMs, o_.waitMs);
        int n = s_.Command(line, [this](const maahost::Frame &f) { Print(f); }, wait);
        if (n < 0) std::cerr << "usbadapter-shell: " << s_.Error() << "\n";
        return n >= 0;
    }

    // A file's size is checked before it is read: a refused one need not fit in memory.
    bool Put(const std::string &path) {
        std::error_code ec;
        const uintmax_t onDisk = std::filesystem::file_size(path, ec);
        std::string refused = ec ? "" : maahost::CheckDownloadSize(onDisk);
        std::string bytes;
        if (refused.empty()) {
            if (!ReadAll(path, &bytes)) {
                std::cerr << "usbadapter-shell: cannot read " << path << "\n";
                return true;
            }
            refused = maahost::CheckDownloadSize(bytes.size());
        }
        if (!refused.empty()) {
            std::cerr << "usbadapter-shell: " << path << " not put: " << refused << "\n";
            return true;
        }
        std::optional<uint32_t> a = s_.Download(bytes);
        if (!a) {
            std::cerr << "usbadapter-shell: " << s_.Error() << "\n";
            return false;
        }
        char text[16];
        std::snprintf(text, sizeof text, "0x%08X", *a);
        addr_ = text;
        std::cout << "<put " << path << ", " << bytes.size() << " bytes at " << addr_ << ">\n";
        return true;
    }

    // Auto session: the lines go into the device's buffer and run after the
    // stop. Each line takes its length + 2 bytes there, an address 10.
    bool Auto(std::vector<std::string> lines) {
        if (size_t dropped = maahost::DropBlankLines(&lines))
            std::cerr << "usbadapter-shell: " << dropped << " blank line" << (dropped == 1 ? "" : "s")
                      << " dropped from the auto script (the device's auto run would stop there)\n";
        size_t size = 1;
        for (const std::string &l : lines) size += Substitute(l, "0x00000000").size() + 2;
        if (!s_.SendSpecial(maahost::kOpAutoStart, static_cast<uint32_t>(size))) return false;
        for (const std::string &typed : lines) {
            const std::string line = Substitute(typed, addr_);
            if (line.rfind("!put ", 0) == 0 ? !Put(line.substr(5)) : !s_.SendLine(line)) return false;
        }
        return s_.SendSpecial(maahost::kOpAutoEnd, 0);
    }

private:
    maahost::Session &s_;
    const Options &o_;
    std::string addr_;
    int uploads_ = 0;
};

}  // namespace

int main(int argc, char **argv) {
    Options o;
    enum { kAuto = 256, kRaw, kNoStop, kShortWait };
    const option longOptions[] = {
        {"exec", required_argument, nullptr, 'e'},  {"script", required_argument, nullptr, 's'},
        {"put", required_argument, nullptr, 'p'},   {"auto", no_argument, nullptr, kAuto},
        {"save", required_argument, nullptr, 'o'},  {"wait", required_argument, nullptr, 'w'},
        {"timeout", required_argument, nullptr, 't'}, {"raw", no_argument, nullptr, kRaw},
        {"no-stop", no_argument, nullptr, kNoStop}, {"help", no_argument, nullptr, 'h'},
        {"short-wait", required_argument, nullptr, kShortWait},
        {nullptr, 0, nullptr, 0},
    };
    bool anySource = false;
    for (int c; (c = getopt_long(argc, argv, "e:s:p:o:w:t:h", longOptions, nullptr)) != -1;) {
        switch (c) {
        case 'e': o.lines.push_back(optarg); anySource = true; break;
        case 's': {
            anySource = true;
            if (std::string(optarg) == "-") {
                ReadLines(std::cin, &o.lines);
                break;
            }
            std::ifstream in(optarg);
            if (!in) return Usage(std::string("cannot read ") + optarg);
            ReadLines(in, &o.lines);
            break;
        }
        case 'p': o.lines.push_back(std::string("!put ") + optarg); anySource = true; break;
        case kAuto: o.autoMode = true; break;
        case 'o': o.saveDir = optarg; break;
        case 'w': o.waitMs = std::atoi(optarg); break;
        case kShortWait: o.shortWaitMs = std::atoi(optarg); break;
        case 't': o.timeoutMs = std::atoi(optarg); break;
        case kRaw: o.raw = true; break;
        case kNoStop: o.stop = false; break;
        case 'h': std::fputs(kUsage, stdout); return 0;
        default: return Usage("unknown option");
        }
    }
    if (optind + 1 != argc) return Usage("one DEVICE expected");
    if (o.waitMs <= 0 || o.shortWaitMs <= 0 || o.timeoutMs <= 0)
        return Usage("--wait, --short-wait and --timeout take a positive number of milliseconds");
    o.device = argv[optind];
    o.fromStdin = !anySource;
    if (o.fromStdin && o.autoMode) ReadLines(std::cin, &o.lines);

    const int fd = ::open(o.device.c_str(), O_RDWR | O_NOCTTY | O_CLOEXEC);
    if (fd < 0) {
        std::perror(o.device.c_str());
        return 3;
    }
    maahost::FdChannel channel(fd);
    maahost::Session session(channel, o.timeoutMs);
    Shell shell(session, o);
    if (!session.Start()) {
        std::cerr << "usbadapter-shell: " << session.Error() << "\n";
        return 1;
    }
    bool ok = true;
    if (o.autoMode) {
        ok = shell.Auto(o.lines);
    } else if (!o.fromStdin) {
        for (const std::string &l : o.lines)
            if (!(ok = shell.Run(l))) break;
    } else {
        const bool tty = ::isatty(0);
        for (std::string line;;) {
            if (tty) std::cout << "maa> " << std::flush;
            if (!std::getline(std::cin, line)) break;
            if (!line.empty() && line.back() == '\r') line.pop_back();
            if (!(ok = shell.Run(line))) break;
        }
    }
    if (ok && o.stop && !session.Stop()) {
        std::cerr << "usbadapter-shell: " << session.Error() << "\n";
        ok = false;
    }
    ::close(fd);
    return ok ? 0 : 1;
}
