// Host stand-in for the HIDL runtime's call status: what a binder transaction
// reports besides the method's own result. As on a device, a Return that holds
// a transport error aborts the process when it is destroyed unchecked.
#pragma once

#include <cstdint>
#include <string>

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
    std::string description() const;

  private:
    explicit Status(int32_t code) : mException(code) {}
    int32_t mException = EX_NONE;
};

namespace details {

// Move-only, like the platform's: the status belongs to one owner, who must
// ask isOk() before it goes away if the call may have failed.
class return_status {
  public:
    return_status() = default;
    return_status(const Status& s) : mStatus(s) {}  // NOLINT(implicit)
    return_status(const return_status&) = delete;
    return_status& operator=(const return_status&) = delete;
    return_status(return_status&& other) noexcept { take(other); }
    return_status& operator=(return_status&& other) noexcept {
        checkOnRelease();
        take(other);
        return *this;
    }
    ~return_status() { checkOnRelease(); }

    bool isOk() const {
        mCheckedStatus = true;
        return mStatus.isOk();
    }
    bool isOkUnchecked() const { return mStatus.isOk(); }
    // Answering true is a check of the status too; false leaves isOk() to be asked.
    bool isDeadObject() const {
        bool dead = mStatus.exceptionCode() == Status::EX_TRANSACTION_FAILED;
        if (dead) mCheckedStatus = true;
        return dead;
    }
    std::string description() const { return mStatus.description(); }

  protected:
    // Reading the value of a failed call is a bug the runtime stops at once.
    void assertOk() const;

  private:
    void take(return_status& other) {
        mStatus = other.mStatus;
        mCheckedStatus = other.mCheckedStatus;
        other.mCheckedStatus = true;
    }
    // Aborts, naming the status, when a failed call was never checked.
    void checkOnRelease() const;

    Status mStatus;
    mutable bool mCheckedStatus = false;
};

}  // namespace details

template <typename T>
class Return : public details::return_status {
  public:
    Return(T value) : mValue(value) {}  // NOLINT(implicit)
    Return(const Status& s) : details::return_status(s), mValue() {}  // NOLINT(implicit)
    Return(Return&&) noexcept = default;
    Return& operator=(Return&&) noexcept = default;

    T withDefault(T def) const { return isOk() ? mValue : def; }
    operator T() const {  // NOLINT(implicit)
        assertOk();
        return mValue;
    }

  private:
    T mValue;
};

template <>
class Return<void> : public details::return_status {
  public:
    Return() = default;
    Return(const Status& s) : details::return_status(s) {}  // NOLINT(implicit)
    Return(Return&&) noexcept = default;
    Return& operator=(Return&&) noexcept = default;
};

inline Return<void> Void() { return Return<void>(); }

}  // namespace hardware
}  // namespace android
