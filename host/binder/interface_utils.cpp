// Host stand-in for the NDK's C++ interface bases: the binder a local object
// is reached through keeps the object alive. Any thread.
#include <memory>

#include <android/binder_interface_utils.h>

namespace ndk {

namespace {

// A local object's binder holds this: the object lives while the binder has a strong reference.
struct ICInterfaceData {
    std::shared_ptr<ICInterface> interface;
};

void* onCreate(void* args) {
    // args is the object itself, which was made by make<T> and so has its shared_ptr family.
    ICInterface* object = static_cast<ICInterface*>(args);
    return new ICInterfaceData{object->ref<ICInterface>()};
}

void onDestroy(void* userData) { delete static_cast<ICInterfaceData*>(userData); }

}  // namespace

std::shared_ptr<ICInterface> ICInterface::asInterface(AIBinder* binder) {
    void* userData = AIBinder_getUserData(binder);
    if (userData == nullptr) return nullptr;
    return static_cast<ICInterfaceData*>(userData)->interface;
}

AIBinder_Class* ICInterface::defineClass(const char* interfaceDescriptor, AIBinder_Class_onTransact onTransact) {
    return AIBinder_Class_define(interfaceDescriptor, onCreate, onDestroy, onTransact);
}

}  // namespace ndk
