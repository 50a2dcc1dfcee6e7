// usbadapter-fw: packs firmware images into a firmware file and sends it down
// a printer's USB print channel (a printer-class node such as /dev/usb/lp0, or
// the simulator's pseudo-terminal), with a progress bar on a terminal.
#include <fcntl.h>
#include <getopt.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

#include "FwPack.h"

namespace {

const char kUsage[] =
    "usage: usbadapter-fw [options] DEVICE ID=IMAGE...\n"
    "\n"
    "Sends a firmware file to the printer on DEVICE, its USB print channel (on a\n"
    "Linux host the printer-class node, e.g. /dev/usb/lp0). Each ID=IMAGE adds\n"
    "an image: ID is the subsystem id (E7 scanner, E1 engine, EC2 kernel, ...),\n"
    "IMAGE the file of its body. Each image goes as an 80-byte PJL header with\n"
    "the body size, then the body; the printer checksums it for its update\n"
    "manager. DEVICE '-' with -o only writes the file.\n"
    "\n"
    "  -o, --output FILE   also write the firmware file to FILE\n"
    "  -b, --block N       bytes per write to DEVICE (default 65536)\n"
    "  -q, --quiet         no progress bar\n"
    "  -h, --help          this text\n"
    "\n"
    "Exit status: 0 sent; 1 a write failed; 2 usage or an unreadable image;\n"
    "3 DEVICE could not be opened.\n";

struct Image {
    std::string id, path, body;
};

bool WriteAll(int fd, const char *p, size_t n) {
    while (n > 0) {
        ssize_t w = ::write(fd, p, n);
        if (w < 0 && errno == EINTR) continue;
        if (w <= 0) return false;
        p += w;
        n -= static_cast<size_t>(w);
    }
    return true;
}

void Bar(size_t done, size_t total, const std::string &what) {
    const int width = 40;
    const int filled = total ? static_cast<int>(static_cast<double>(done) / static_cast<double>(total) * width) : width;
    std::fprintf(stderr, "\r[%-*s] %3d%% %s", width, std::string(static_cast<size_t>(filled), '#').c_str(),
                 total ? static_cast<int>(done * 100 / total) : 100, what.c_str());
    std::fflush(stderr);
}

}  // namespace

int main(int argc, char **argv) {
    std::string output;
    size_t block = 65536;
    bool quiet = false;
    static const option longOpts[] = {{"output", required_argument, nullptr, 'o'},
                                      {"block", required_argument, nullptr, 'b'},
                                      {"quiet", no_argument, nullptr, 'q'},
                                      {"help", no_argument, nullptr, 'h'},
                                      {nullptr, 0, nullptr, 0}};
    for (int c; (c = ::getopt_long(argc, argv, "o:b:qh", longOpts, nullptr)) != -1;) {
        switch (c) {
        case 'o': output = optarg; break;
        case 'b': block = std::strtoul(optarg, nullptr, 10); break;
        case 'q': quiet = true; break;
        case 'h': std::fputs(kUsage, stdout); return 0;
        default: std::fputs(kUsage, stderr); return 2;
        }
    }
    if (argc - optind < 2 || block == 0) {
        std::fputs(kUsage, stderr);
        return 2;
    }
    const std::string device = argv[optind];
    std::vector<Image> images;
    for (int i = optind + 1; i < argc; ++i) {
        const std::string arg = argv[i];
        const size_t eq = arg.find('=');
        Image im;
        if (eq != std::string::npos) {
            im.id = arg.substr(0, eq);
            im.path = arg.substr(eq + 1);
        }
        if (!fwpack::ValidId(im.id) || im.path.empty()) {
            std::fprintf(stderr, "usbadapter-fw: '%s': ID=IMAGE expected (ID of 1 to 4 characters)\n", arg.c_str());
            return 2;
        }
        std::ifstream in(im.path, std::ios::binary);
        std::ostringstream all;
        all << in.rdbuf();
        if (!in) {
            std::fprintf(stderr, "usbadapter-fw: cannot read %s\n", im.path.c_str());
            return 2;
        }
        im.body = all.str();
        if (im.body.size() > 0xFFFFFFFFu) {
            std::fprintf(stderr, "usbadapter-fw: %s: 4 GiB or more do not fit the size field\n", im.path.c_str());
            return 2;
        }
        images.push_back(std::move(im));
    }
    size_t total = 0;
    for (const Image &im : images) total += fwpack::kHeaderSize + im.body.size();

    if (!output.empty()) {
        std::ofstream out(output, std::ios::binary);
        for (const Image &im : images)
            out << fwpack::Header(im.id, static_cast<uint32_t>(im.body.size())) << im.body;
        if (!out) {
            std::fprintf(stderr, "usbadapter-fw: cannot write %s\n", output.c_str());
            return 1;
        }
    }
    if (device == "-") return output.empty() ? 2 : 0;

    const int fd = ::open(device.c_str(), O_WRONLY | O_NOCTTY | O_CLOEXEC);
    if (fd < 0) {
        std::fprintf(stderr, "usbadapter-fw: cannot open %s: %s\n", device.c_str(), std::strerror(errno));
        return 3;
    }
    const bool bar = !quiet && ::isatty(2);
    size_t done = 0;
    for (const Image &im : images) {
        // The header is a write of its own: the printer takes it with one read.
        const std::string h = fwpack::Header(im.id, static_cast<uint32_t>(im.body.size()));
        bool ok = WriteAll(fd, h.data(), h.size());
        done += h.size();
        for (size_t at = 0; ok && at < im.body.size(); at += block) {
            const size_t n = std::min(block, im.body.size() - at);
            ok = WriteAll(fd, im.body.data() + at, n);
            done += n;
            if (bar) Bar(done, total, im.id + " " + im.path);
        }
        if (!ok) {
            std::fprintf(stderr, "\nusbadapter-fw: writing to %s failed: %s\n", device.c_str(), std::strerror(errno));
            ::close(fd);
            return 1;
        }
        if (bar) Bar(done, total, im.id + " " + im.path);
    }
    if (bar) std::fputc('\n', stderr);
    ::close(fd);
    if (!quiet) std::fprintf(stderr, "usbadapter-fw: %zu image(s), %zu bytes sent to %s\n", images.size(), total, device.c_str());
    return 0;
}
