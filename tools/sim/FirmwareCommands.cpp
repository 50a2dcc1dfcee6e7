#include "FirmwareCommands.h"

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>

#include "Data.h"
#include "FwPack.h"
#include "Host.h"
#include "Sha256.h"
#include "UpdateManagerSim.h"
#include "vdev.h"

namespace sim {
namespace {

// The library reads the port at each connect.
constexpr const char *kPortVariable = "USBADAPTER_UPDATE_PORT";

peers::UpdateManagerSim &Manager() {
    static peers::UpdateManagerSim manager;
    return manager;
}
bool &ManagerRunning() {
    static bool running = false;
    return running;
}

bool NeedManager(std::string *error) {
    if (ManagerRunning()) return true;
    *error = "no update manager: start one with fw-manager";
    return false;
}

bool Number(const std::string &text, long long *v, std::string *error) {
    size_t n = 0;
    if (!ParseSize(text, &n)) {
        *error = "not a number: '" + text + "'";
        return false;
    }
    *v = static_cast<long long>(n);
    return true;
}

// "ID DATA... [, ID DATA...]" into (id, data items) groups.
bool SplitImages(const Args &a, std::vector<std::pair<std::string, Args>> *out, std::string *error) {
    for (size_t i = 0; i < a.size();) {
        if (!fwpack::ValidId(a[i])) {
            *error = "subsystem id expected (1 to 4 characters), not '" + a[i] + "'";
            return false;
        }
        std::pair<std::string, Args> image{a[i++], {}};
        while (i < a.size() && a[i] != ",") image.second.push_back(a[i++]);
        if (image.second.empty()) {
            *error = "image " + image.first + ": data expected";
            return false;
        }
        for (const std::string &item : image.second)
            if (!CheckDataItem(item, error)) return false;
        out->push_back(std::move(image));
        if (i < a.size()) ++i;  // ","
    }
    return true;
}

bool Expect(Session &s, JsonLine line, bool ok, const std::string &failure, std::string *error) {
    s.Sim(line.Bool("ok", ok));
    if (!ok) *error = failure;
    return ok;
}

std::string FileSha(const std::string &path, long long *size) {
    std::ifstream in(path, std::ios::binary);
    std::ostringstream all;
    all << in.rdbuf();
    *size = in ? static_cast<long long>(all.str().size()) : -1;
    return Sha256Hex(all.str());
}

}  // namespace

bool CheckFwManager(const Args &a, std::string *error) {
    peers::UmMisbehaviour m;
    if (a.empty() || peers::ParseUmMisbehaviour(a[0], &m)) return true;
    *error = "misbehaviour: none, checksum-error, progress-fail, silence, early-close or slow-progress";
    return false;
}

bool FwManager(Session &s, const Args &a, std::string *error) {
    peers::UmOptions o;
    if (!a.empty()) peers::ParseUmMisbehaviour(a[0], &o.misbehaviour);
    o.dir = s.outDir + "/update-manager";
    std::error_code ec;
    std::filesystem::create_directories(o.dir, ec);
    peers::UpdateManagerSim &m = Manager();
    if (ManagerRunning()) {
        // Same manager, same images so far: only its behaviour changes.
        m.SetMisbehaviour(o.misbehaviour);
    } else {
        if (!m.Start(o, error)) return false;
        ManagerRunning() = true;
        ::setenv(kPortVariable, std::to_string(m.Port()).c_str(), 1);
    }
    s.Sim(JsonLine("fw-manager").Num("port", m.Port()).Str("misbehaviour", peers::UmMisbehaviourName(o.misbehaviour))
              .Str("dir", o.dir));
    return true;
}

bool CheckFwSend(const Args &a, std::string *error) {
    std::vector<std::pair<std::string, Args>> images;
    return SplitImages(a, &images, error);
}

bool FwSend(Session &s, const Args &a, std::string *error) {
    std::vector<std::pair<std::string, Args>> images;
    if (!SplitImages(a, &images, error)) return false;
    std::string all;
    for (const auto &[id, items] : images) {
        std::string body;
        if (!BuildData(items, s.baseDir, &body, error)) return false;
        if (body.size() > 0xFFFFFFFFu) {
            *error = "image " + id + ": 4 GiB or more";
            return false;
        }
        // A driver's transfers: the header, then the body.
        const std::string header = fwpack::Header(id, static_cast<uint32_t>(body.size()));
        vdev::HostWrite(vdev::kPrn, header);
        if (!body.empty()) vdev::HostWrite(vdev::kPrn, body);
        s.transfersSent += body.empty() ? 1 : 2;
        s.Host(JsonLine("fw-image").Str("id", id).Num("bytes", static_cast<long long>(body.size()))
                   .Str("sha256", Sha256Hex(body)));
        all += header + body;
    }
    s.bytesSent += all.size();
    s.Host(JsonLine("fw-send").Num("images", static_cast<long long>(images.size()))
               .Num("bytes", static_cast<long long>(all.size())));
    return true;
}

bool CheckFwExpectImages(const Args &a, std::string *error) {
    long long v;
    if (!Number(a[0], &v, error)) return false;
    if (a.size() == 1) return true;
    if (a.size() == 3 && a[1] == "ends") return Number(a[2], &v, error);
    *error = "fw-expect-images N [ends M]";
    return false;
}

bool FwExpectImages(Session &s, const Args &a, std::string *error) {
    if (!NeedManager(error)) return false;
    long long want = 0, ends = -1;
    Number(a[0], &want, error);
    if (a.size() == 3) Number(a[2], &ends, error);
    peers::UpdateManagerSim &m = Manager();
    auto settled = [&] {
        int complete = 0;
        for (const peers::UmImage &im : m.Images()) complete += im.complete;
        return complete;
    };
    // After the last image the printer waits for a header that does not come:
    // the host's silence, delivered as one read time-out of the node.
    bool expired = false;
    WaitUntil(
        [&] {
            if (settled() < want) return false;
            if (ends < 0 || m.Ends() >= ends) return true;
            if (!expired && vdev::PendingHostBytes(vdev::kPrn) == 0) {
                vdev::ExpireRead(vdev::kPrn, 1);
                expired = true;
            }
            return false;
        },
        s.timeoutMs);
    // Whatever the library still does with the manager (progress) ends first.
    if (!s.WaitIdle(error)) return false;
    s.SyncJava();
    const int got = settled();
    JsonLine line("expect");
    line.Str("what", "fw-images").Num("want", want).Num("got", got);
    if (ends >= 0) line.Num("want-ends", ends).Num("ends", m.Ends());
    const bool ok = got == want && (ends < 0 || m.Ends() == ends);
    return Expect(s, line, ok,
                  std::to_string(got) + " image(s) and " + std::to_string(m.Ends()) +
                      " end(s) at the update manager, expected " + a[0] + (ends >= 0 ? " and " + a[2] : ""),
                  error);
}

// fw-expect-image K [type T] [bytes N] [sha256 HEX] [checksum ok|bad] [equals DATA...]
bool CheckFwExpectImage(const Args &a, std::string *error) {
    long long v;
    if (!Number(a[0], &v, error)) return false;
    for (size_t i = 1; i < a.size(); i += 2) {
        if (a[i] == "equals") {
            for (size_t j = i + 1; j < a.size(); ++j)
                if (!CheckDataItem(a[j], error)) return false;
            return i + 1 < a.size() || (*error = "equals needs data", false);
        }
        if (i + 1 >= a.size()) {
            *error = a[i] + " needs a value";
            return false;
        }
        if ((a[i] == "type" || a[i] == "bytes") && !Number(a[i + 1], &v, error)) return false;
        if (a[i] == "checksum" && a[i + 1] != "ok" && a[i + 1] != "bad") {
            *error = "checksum ok or bad";
            return false;
        }
        if (a[i] != "type" && a[i] != "bytes" && a[i] != "sha256" && a[i] != "checksum") {
            *error = "unexpected '" + a[i] + "' (type, bytes, sha256, checksum or equals)";
            return false;
        }
    }
    return true;
}

bool FwExpectImage(Session &s, const Args &a, std::string *error) {
    if (!NeedManager(error)) return false;
    long long k = 0;
    Number(a[0], &k, error);
    std::vector<peers::UmImage> images = Manager().Images();
    JsonLine line("expect");
    line.Str("what", "fw-image").Num("image", k);
    if (k < 1 || k > static_cast<long long>(images.size()) || !images[k - 1].complete)
        return Expect(s, line, false, "the update manager has no complete image " + a[0], error);
    const peers::UmImage &im = images[k - 1];
    long long size = 0;
    const std::string sha = FileSha(im.file, &size);
    line.Num("type", im.type).Num("bytes", size).Str("sha256", sha).Bool("checksum-ok", im.checksumOk);
    std::string failure;
    for (size_t i = 1; i < a.size() && failure.empty(); i += 2) {
        long long v = 0;
        if (a[i] == "type") {
            Number(a[i + 1], &v, error);
            if (im.type != v) failure = "image " + a[0] + " has type " + std::to_string(im.type);
        } else if (a[i] == "bytes") {
            Number(a[i + 1], &v, error);
            if (size != v) failure = "image " + a[0] + " has " + std::to_string(size) + " bytes";
        } else if (a[i] == "sha256") {
            if (sha != a[i + 1]) failure = "image " + a[0] + " has SHA-256 " + sha;
        } else if (a[i] == "checksum") {
            if (im.checksumOk != (a[i + 1] == "ok")) failure = "image " + a[0] + " checksum is not " + a[i + 1];
        } else if (a[i] == "equals") {
            std::string want;
            if (!BuildData(Args(a.begin() + static_cast<long>(i) + 1, a.end()), s.baseDir, &want, error)) return false;
            if (Sha256Hex(want) != sha || static_cast<long long>(want.size()) != size)
                failure = "image " + a[0] + " differs from the expected " + std::to_string(want.size()) + " bytes";
            break;
        }
    }
    return Expect(s, line, failure.empty(), failure, error);
}

void FwStopManager() {
    if (ManagerRunning()) Manager().Stop();
}

std::vector<FwImageSeen> FwImages() {
    std::vector<FwImageSeen> seen;
    if (!ManagerRunning()) return seen;
    for (const peers::UmImage &im : Manager().Images())
        seen.push_back({im.type, im.received, im.complete, im.checksumOk, im.file});
    return seen;
}

}  // namespace sim
