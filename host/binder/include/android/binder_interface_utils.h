// Host stand-in for the NDK's C++ interface bases: objects owned through
// std::shared_ptr from their making on, a local object's binder, a proxy's.
// Any thread.
#pragma once

#include <cstddef>
#include <cstdlib>
#include <memory>
#include <mutex>
#include <utility>

#include <android/binder_auto_utils.h>
#include <android/binder_ibinder.h>

namespace ndk {

// Made only by make<T>: a binder may hand the object out again long after the
// maker let go, which needs the one shared_ptr family born with the object.
class SharedRefBase {
  public:
    SharedRefBase() = default;
    virtual ~SharedRefBase() = default;

    template <typename T>
    std::shared_ptr<T> ref() {
        std::shared_ptr<T> thiz;
        std::call_once(mFlagThis, [&] {
            thiz = std::shared_ptr<T>(static_cast<T*>(this));
            mThis = thiz;
        });
        if (thiz == nullptr) thiz = std::static_pointer_cast<T>(mThis.lock());
        return thiz;
    }
    template <typename T>
    std::shared_ptr<const T> ref() const {
        return const_cast<SharedRefBase*>(this)->ref<T>();
    }

    template <class T, class... Args>
    static std::shared_ptr<T> make(Args&&... args) {
        T* t = new T(std::forward<Args>(args)...);
        return t->template ref<T>();
    }

    static void operator delete(void* p) { std::free(p); }

  private:
    // Private so that `new T` outside make does not compile.
    static void* operator new(size_t size) { return std::malloc(size); }

    std::once_flag mFlagThis;
    std::weak_ptr<SharedRefBase> mThis;
};

class ICInterface : public SharedRefBase {
  public:
    ICInterface() = default;
    virtual ~ICInterface() = default;

    virtual SpAIBinder asBinder() = 0;
    virtual bool isRemote() = 0;

    // The local object behind a binder that one of these classes made, or null.
    static std::shared_ptr<ICInterface> asInterface(AIBinder* binder);
    // A binder of this class holds its object alive until the binder's last strong reference goes.
    static AIBinder_Class* defineClass(const char* interfaceDescriptor, AIBinder_Class_onTransact onTransact);
};

// A local object: one binder at a time, made on first asking and kept while anyone holds it.
template <typename INTERFACE>
class BnCInterface : public INTERFACE {
  public:
    BnCInterface() = default;
    virtual ~BnCInterface() = default;

    SpAIBinder asBinder() override {
        std::lock_guard<std::mutex> guard(mMutex);
        SpAIBinder binder = mWeakBinder.promote();
        if (binder.get() == nullptr) {
            binder = createBinder();
            mWeakBinder.set(AIBinder_Weak_new(binder.get()));
        }
        return binder;
    }
    bool isRemote() override { return false; }

  protected:
    virtual SpAIBinder createBinder() = 0;

  private:
    std::mutex mMutex;
    ScopedAIBinder_Weak mWeakBinder;
};

// A proxy: calls travel through the binder it holds.
template <typename INTERFACE>
class BpCInterface : public INTERFACE {
  public:
    explicit BpCInterface(const SpAIBinder& binder) : mBinder(binder) {}
    virtual ~BpCInterface() = default;

    SpAIBinder asBinder() override { return mBinder; }
    bool isRemote() override { return true; }

  private:
    SpAIBinder mBinder;
};

}  // namespace ndk
