// The fax driver model behind /dev/fax: test command lines answered with a
// scripted response in the same record.
#include <cerrno>
#include <cstring>

#include "Model.h"
#include "vdev.h"

namespace vdev {

namespace {

struct Fax {
    FaxTestAnswer answer;
    std::vector<std::string> commands;
};

Fax &F() {
    static Fax *f = new Fax;
    return *f;
}

}  // namespace

namespace detail {

void FaxReset() { F() = Fax{}; }

int FaxIoctl(IoctlContext &ctx, unsigned long request, void *arg) {
    if (request != IOCNR_FAX_MAA_TEST) return ctx.injectedError ? -ctx.injectedError : -ENOTTY;
    if (!IsPointer(arg)) return -EFAULT;
    TFaxMAATest rec;
    std::memcpy(&rec, arg, sizeof rec);
    const uint8_t *in = reinterpret_cast<const uint8_t *>(&rec);
    ctx.payload.assign(in, in + sizeof rec);
    if (ctx.injectedError) return -ctx.injectedError;
    Fax &f = F();
    f.commands.emplace_back(rec.string, strnlen(rec.string, sizeof rec.string));
    const FaxTestAnswer &a = f.answer;
    if (a.status < 0) return a.status;
    std::memset(rec.response, 0, sizeof rec.response);
    const size_t n = std::min(a.response.size(), sizeof rec.response);
    std::memcpy(rec.response, a.response.data(), n);
    rec.result = a.result ? *a.result : static_cast<uint32_t>(n);
    rec.success = a.success;
    std::memcpy(arg, &rec, sizeof rec);
    return a.status;
}

}  // namespace detail

void SetFaxTestAnswer(const FaxTestAnswer &answer) {
    std::lock_guard lk(detail::ModelMutex());
    F().answer = answer;
}

std::vector<std::string> FaxCommands() {
    std::lock_guard lk(detail::ModelMutex());
    return F().commands;
}

}  // namespace vdev
