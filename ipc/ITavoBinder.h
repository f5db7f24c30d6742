// The binder interface of the one service that owns message queues and shared-memory blocks by key.
#pragma once

#include <binder/IInterface.h>
#include <binder/IMemory.h>
#include <utils/String16.h>

#include "tavo_osal/export.h"

namespace android {

/**
 * What processes ask of the service. The service object itself implements it, and so does the proxy that
 * another process has.
 *
 * The order of the virtual functions is part of the binary interface.
 */
class TAVO_API ITavoBinder : public IInterface {
public:
    /** The interface descriptor, "tavo.mq": every request carries it and the stub checks it. It is deliberately not
     *  the name under which the service is published. */
    static const String16 descriptor;

    ITavoBinder();
    ~ITavoBinder() override;

    virtual const String16& getInterfaceDescriptor() const;

    /**
     * Read end of a queue's pipe.
     * @return from the proxy: a descriptor that the caller owns; from the service: its own descriptor, which
     *         stays its own; -1: no such queue, or the service is gone
     */
    virtual int get_fd(int key) = 0;

    /** Write end of a queue's pipe; as get_fd(). */
    virtual int get_write_fd(int key) = 0;

    /**
     * Creates the queue of a key, or counts one more use of it.
     * @param key any number but 0
     * @return the queue's place in the service's table, which moves when others are deleted, or -1; 0 also when the
     *         service is gone
     */
    virtual int create_message_queue(int key) = 0;

    /**
     * Counts one use less; the last one deletes the queue.
     * @return 0 or -1
     */
    virtual int delete_message_queue(int key) = 0;

    /**
     * Creates the block of a key, or counts one more use of it and returns it whatever its size.
     * @param key  any number but 0
     * @param size bytes, at least 1
     * @return the block; null: invalid arguments, or the service is gone
     */
    virtual sp<IMemoryHeap> get_shared_mem(int key, int size) = 0;

    /**
     * Counts one use less; with the last one the service forgets the block, which lives on in those who mapped it.
     * @param key a positive number: blocks of negative keys cannot be deleted
     * @return 0, -1 or TAVO_FAILURE
     */
    virtual int delete_shared_mem(int key) = 0;

    /** The service itself when it lives in this process, otherwise a new proxy; null for null. */
    static sp<ITavoBinder> asInterface(const sp<IBinder>& obj);
};

/** Turns each operation into one transaction. May be used from any thread; blocks until the reply is there. */
class TAVO_API BpTavoBinder : public BpInterface<ITavoBinder> {
public:
    explicit BpTavoBinder(const sp<IBinder>& impl);
    ~BpTavoBinder() override;

    int get_fd(int key) override;
    int get_write_fd(int key) override;
    int create_message_queue(int key) override;
    int delete_message_queue(int key) override;
    sp<IMemoryHeap> get_shared_mem(int key, int size) override;
    int delete_shared_mem(int key) override;
};

/** Unpacks each transaction and calls the service. Runs on the binder thread pool, several at once. */
class TAVO_API BnTavoBinder : public BnInterface<ITavoBinder> {
public:
    status_t onTransact(uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags = 0) override;
};

}  // namespace android
