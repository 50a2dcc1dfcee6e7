// The JBIG codec model behind /dev/jbigenc and /dev/jbigdec: reset and the
// engine's built-in self test, whose status each node's script decides.
#include <cerrno>
#include <cstring>
#include <stdexcept>
#include <string>

#include "Model.h"
#include "vdev.h"

namespace vdev {

namespace {

struct Engine {
    uint32_t selfTestStatus = 0;
    int resets = 0;
};

struct Jbig {
    Engine enc, dec;
};

Jbig &J() {
    static Jbig *j = new Jbig;
    return *j;
}

Engine &EngineOf(int node) { return node == detail::FindNode(JBIG_ENC_DEVICE_NAME) ? J().enc : J().dec; }

Engine &EngineOf(const char *path) {
    if (std::strcmp(path, JBIG_ENC_DEVICE_NAME) == 0) return J().enc;
    if (std::strcmp(path, JBIG_DEC_DEVICE_NAME) == 0) return J().dec;
    throw std::invalid_argument(std::string("vdev: not a JBIG node: ") + path);
}

}  // namespace

namespace detail {

void JbigReset() { J() = Jbig{}; }

int JbigIoctl(IoctlContext &ctx, unsigned long request, void *arg) {
    Engine &e = EngineOf(ctx.node);
    switch (request) {
    case JBIG_IOC_RESET:
        if (ctx.injectedError) return -ctx.injectedError;
        ++e.resets;
        return 0;
    case JBIG_IOC_SELFTEST: {
        if (!IsPointer(arg)) return -EFAULT;
        TJBIGSelfTest rec;
        std::memcpy(&rec, arg, sizeof rec);
        const uint8_t *in = reinterpret_cast<const uint8_t *>(&rec);
        ctx.payload.assign(in, in + sizeof rec);
        if (ctx.injectedError) return -ctx.injectedError;
        rec.ulStatus = e.selfTestStatus;
        std::memcpy(arg, &rec, sizeof rec);
        return 0;
    }
    default: return ctx.injectedError ? -ctx.injectedError : -ENOTTY;
    }
}

}  // namespace detail

void SetJbigSelfTestStatus(const char *path, uint32_t status) {
    std::lock_guard lk(detail::ModelMutex());
    EngineOf(path).selfTestStatus = status;
}

int JbigResets(const char *path) {
    std::lock_guard lk(detail::ModelMutex());
    return EngineOf(path).resets;
}

}  // namespace vdev
