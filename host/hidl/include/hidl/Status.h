// Host stand-in for the HIDL runtime's call status: what a binder transaction
// reports besides the method's own result.
#pragma once

#include <cstdint>

namespace android {
namespace hardware {

class Status {
  public:
    enum Exception : int32_t {
        EX_NONE = 0,
        EX_ILLEGAL_STATE = -5,
        EX_TRANSACTION_FAILED = -129,
    };

    Status() = default;
    static Status ok() { return Status(); }
    static Status fromExceptionCode(int32_t code) { return Status(code); }

    bool isOk() const { return mException == EX_NONE; }
    int32_t exceptionCode() const { return mException; }

  private:
    explicit Status(int32_t code) : mException(code) {}
    int32_t mException = EX_NONE;
};

namespace details {
class return_status {
  public:
    return_status() = default;
    return_status(const Status& s) : mStatus(s) {}  // NOLINT(implicit)
    bool isOk() const { return mStatus.isOk(); }
    bool isDeadObject() const { return mStatus.exceptionCode() == Status::EX_TRANSACTION_FAILED; }
    const Status& getStatus() const { return mStatus; }

  private:
    Status mStatus;
};
}  // namespace details

template <typename T>
class Return : public details::return_status {
  public:
    Return(T value) : mValue(value) {}  // NOLINT(implicit)
    Return(const Status& s) : details::return_status(s), mValue() {}  // NOLINT(implicit)
    T withDefault(T def) const { return isOk() ? mValue : def; }
    operator T() const { return mValue; }  // NOLINT(implicit)

  private:
    T mValue;
};

template <>
class Return<void> : public details::return_status {
  public:
    Return() = default;
    Return(const Status& s) : details::return_status(s) {}  // NOLINT(implicit)
};

inline Return<void> Void() { return Return<void>(); }

}  // namespace hardware
}  // namespace android
