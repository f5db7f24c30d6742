// Interface classes, and the templates that make a stub and a proxy of one.
#pragma once

#include <binder/Binder.h>

namespace android {

class LIBBINDER_EXPORT IInterface : public virtual RefBase {
public:
    IInterface();

    // The binder object behind an interface; null for null.
    static sp<IBinder> asBinder(const IInterface* iface);
    static sp<IBinder> asBinder(const sp<IInterface>& iface);

protected:
    ~IInterface() override;
    virtual IBinder* onAsBinder() = 0;
};

// The object itself when it lives in this process, otherwise a new proxy for it; null for null.
template <typename INTERFACE>
inline sp<INTERFACE> interface_cast(const sp<IBinder>& obj) {
    return INTERFACE::asInterface(obj);
}

template <typename INTERFACE>
class LIBBINDER_EXPORT BnInterface : public INTERFACE, public BBinder {
public:
    sp<IInterface> queryLocalInterface(const String16& requested) override;
    const String16& getInterfaceDescriptor() const override;

protected:
    IBinder* onAsBinder() override;
};

template <typename INTERFACE>
class LIBBINDER_EXPORT BpInterface : public INTERFACE, public BpRefBase {
public:
    explicit BpInterface(const sp<IBinder>& remote);

protected:
    IBinder* onAsBinder() override;
};

template <typename INTERFACE>
inline sp<IInterface> BnInterface<INTERFACE>::queryLocalInterface(const String16& requested) {
    if (requested == INTERFACE::descriptor) return this;
    return nullptr;
}

template <typename INTERFACE>
inline const String16& BnInterface<INTERFACE>::getInterfaceDescriptor() const {
    return INTERFACE::getInterfaceDescriptor();
}

template <typename INTERFACE>
IBinder* BnInterface<INTERFACE>::onAsBinder() {
    return this;
}

template <typename INTERFACE>
inline BpInterface<INTERFACE>::BpInterface(const sp<IBinder>& remote) : BpRefBase(remote) {}

template <typename INTERFACE>
inline IBinder* BpInterface<INTERFACE>::onAsBinder() {
    return remote();
}

}  // namespace android

// In the public part of the class I<INTERFACE>.
#define DECLARE_META_INTERFACE(INTERFACE)                                                         \
    static const ::android::String16 descriptor;                                                  \
    static ::android::sp<I##INTERFACE> asInterface(const ::android::sp<::android::IBinder>& obj); \
    virtual const ::android::String16& getInterfaceDescriptor() const;                            \
    I##INTERFACE();                                                                               \
    virtual ~I##INTERFACE();

// In the source file that defines the proxy, Bp<INTERFACE>, in the namespace of both.
#define IMPLEMENT_META_INTERFACE(INTERFACE, NAME)                                                         \
    const ::android::String16 I##INTERFACE::descriptor(NAME);                                             \
    const ::android::String16& I##INTERFACE::getInterfaceDescriptor() const { return descriptor; }        \
    ::android::sp<I##INTERFACE> I##INTERFACE::asInterface(const ::android::sp<::android::IBinder>& obj) { \
        if (obj == nullptr) return nullptr;                                                               \
        const ::android::sp<::android::IInterface> local = obj->queryLocalInterface(descriptor);          \
        if (local != nullptr) return static_cast<I##INTERFACE*>(local.get());                             \
        return new Bp##INTERFACE(obj);                                                                    \
    }                                                                                                     \
    I##INTERFACE::I##INTERFACE() {}                                                                       \
    I##INTERFACE::~I##INTERFACE() {}

// In onTransact, before anything is read.
#define CHECK_INTERFACE(interface, data, reply)  \
    do {                                         \
        if (!(data).checkInterface(this)) {      \
            return ::android::PERMISSION_DENIED; \
        }                                        \
    } while (false)
