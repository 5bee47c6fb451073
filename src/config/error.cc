#include "kolt/error.h"

#include <cerrno>

namespace kolt {
namespace {

const char* vornText(int code) {
  switch (code) {
    case kVornSanDeleted: return "San has been deleted";
    case kVornNoConfiguration: return "No existing configuration";
    case kVornSanNameMismatch: return "San name mismatch";
    case kVornSanUuidMismatch: return "San UUID mismatch";
    case kVornSanNameMissing: return "San name missing";
    case kVornSanServerMissing: return "San server missing";
    default: return nullptr;
  }
}

}  // namespace

Error Error::vorn(int code) {
  const char* text = vornText(code);
  return Error(std::string(kVornErrorDomain), code,
               text ? std::optional<std::string>(text) : std::nullopt);
}

Error Error::vorn(int code, std::string description) {
  return Error(std::string(kVornErrorDomain), code, std::move(description));
}

Error Error::posix(int platformCode, std::optional<std::string> description) {
  return Error(std::string(kPosixErrorDomain), platformCode, std::move(description));
}

Error Error::fromErrno(int linuxErrno, std::optional<std::string> description) {
  return posix(platformErrno(linuxErrno), std::move(description));
}

Dictionary Error::userInfo() const {
  Dictionary info;
  if (description_) info.set("NSLocalizedDescription", Value(*description_));
  return info;
}

std::string Error::printed() const {
  std::string out = "Error Domain=" + domain_ + " Code=" + std::to_string(code_);
  if (description_) out += " \"" + *description_ + "\"";
  return out;
}

std::string Error::textForCaller() const {
  if (description_) return *description_;
  return "The operation couldn't be completed. (" + domain_ + " error " + std::to_string(code_) +
         ".)";
}

int platformErrno(int e) {
  // 1..34 share their numbers; the rest differ between Linux and the
  // platform, whose numbers are part of the interface.
  if (e >= 1 && e <= 34) {
    return e == EAGAIN ? 35 : e;  // EAGAIN is 11 on Linux, 35 on the platform
  }
  switch (e) {
    case EDEADLK: return 11;
    case ENAMETOOLONG: return 63;
    case ENOLCK: return 77;
    case ENOSYS: return 78;
    case ENOTEMPTY: return 66;
    case ELOOP: return 62;
    case ENOTSUP: return 45;
    case EHOSTUNREACH: return 65;
    case EADDRINUSE: return 48;
    case EADDRNOTAVAIL: return 49;
    case ENETDOWN: return 50;
    case ENETUNREACH: return 51;
    case ECONNABORTED: return 53;
    case ECONNRESET: return 54;
    case ENOBUFS: return 55;
    case EISCONN: return 56;
    case ENOTCONN: return 57;
    case ETIMEDOUT: return 60;
    case ECONNREFUSED: return 61;
    case EHOSTDOWN: return 64;
    case EPROTONOSUPPORT: return 43;
    case EAFNOSUPPORT: return 47;
    case EINPROGRESS: return 36;
    case EALREADY: return 37;
    case ENOTSOCK: return 38;
    case EDESTADDRREQ: return 39;
    case EMSGSIZE: return 40;
    case EPROTOTYPE: return 41;
    case ENOPROTOOPT: return 42;
    case EOVERFLOW: return 84;
    case ECANCELED: return 89;
    case EILSEQ: return 92;
    case EDQUOT: return 69;
    case ESTALE: return 70;
    default: return e;
  }
}

}  // namespace kolt
