// Host stand-in for the HIDL runtime's support types: the byte vector that
// carries packets across IBluetoothHci, and the death recipient. Mirrors the
// platform API closely enough that code written against it builds unchanged
// on a device.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <initializer_list>
#include <vector>

#include <utils/RefBase.h>

namespace android {
namespace hidl {
namespace base {
namespace V1_0 {
struct IBase;
}  // namespace V1_0
}  // namespace base
}  // namespace hidl

namespace hardware {

// Told when a service it was linked to (IBase::linkToDeath) has died.
struct hidl_death_recipient : public virtual RefBase {
    virtual void serviceDied(uint64_t cookie,
                             const ::android::wp<::android::hidl::base::V1_0::IBase>& who) = 0;
};

template <typename T>
class hidl_vec {
  public:
    hidl_vec() = default;
    explicit hidl_vec(size_t size) { resize(size); }
    hidl_vec(const std::vector<T>& v) { assign(v.data(), v.size()); }  // NOLINT(implicit)
    hidl_vec(std::initializer_list<T> list) { assign(list.begin(), list.size()); }
    hidl_vec(const hidl_vec& other) { assign(other.mBuffer, other.mSize); }
    hidl_vec(hidl_vec&& other) noexcept { take(other); }
    ~hidl_vec() { release(); }

    hidl_vec& operator=(const hidl_vec& other) {
        if (this != &other) {
            release();
            assign(other.mBuffer, other.mSize);
        }
        return *this;
    }
    hidl_vec& operator=(hidl_vec&& other) noexcept {
        if (this != &other) {
            release();
            take(other);
        }
        return *this;
    }

    // Borrows (or, with shouldOwn, adopts a new[]-allocated) buffer without copying.
    void setToExternal(T* data, size_t size, bool shouldOwn = false) {
        release();
        mBuffer = data;
        mSize = size;
        mOwnsBuffer = shouldOwn;
    }

    void resize(size_t size) {
        T* fresh = size ? new T[size]() : nullptr;
        size_t keep = size < mSize ? size : mSize;
        for (size_t i = 0; i < keep; ++i) fresh[i] = mBuffer[i];
        release();
        mBuffer = fresh;
        mSize = size;
        mOwnsBuffer = true;
    }

    T* data() { return mBuffer; }
    const T* data() const { return mBuffer; }
    size_t size() const { return mSize; }
    T& operator[](size_t i) { return mBuffer[i]; }
    const T& operator[](size_t i) const { return mBuffer[i]; }
    T* begin() { return mBuffer; }
    T* end() { return mBuffer + mSize; }
    const T* begin() const { return mBuffer; }
    const T* end() const { return mBuffer + mSize; }
    operator std::vector<T>() const { return std::vector<T>(begin(), end()); }  // NOLINT(implicit)

  private:
    void assign(const T* data, size_t size) {
        mBuffer = size ? new T[size] : nullptr;
        for (size_t i = 0; i < size; ++i) mBuffer[i] = data[i];
        mSize = size;
        mOwnsBuffer = true;
    }
    void take(hidl_vec& other) {
        mBuffer = other.mBuffer;
        mSize = other.mSize;
        mOwnsBuffer = other.mOwnsBuffer;
        other.mBuffer = nullptr;
        other.mSize = 0;
        other.mOwnsBuffer = false;
    }
    void release() {
        if (mOwnsBuffer) delete[] mBuffer;
        mBuffer = nullptr;
        mSize = 0;
        mOwnsBuffer = false;
    }

    T* mBuffer = nullptr;
    size_t mSize = 0;
    bool mOwnsBuffer = false;
};

}  // namespace hardware
}  // namespace android
