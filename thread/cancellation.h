// The cancellation signal, and waits that it ends.
#pragma once

namespace tavo {

// Installs the handler that ends the thread it runs on. A failure is printed on standard output and standard error.
void install_cancel_handler();

// Calls wait(context), during which a cancellation ends the thread at once although the thread holds a shield. A
// cancelled thread calls release(context) once, with the wait's mutex held where the platform takes it again, and
// never returns. Once the wait has returned, the shield holds cancellations off again.
int wait_cancellably(int (*wait)(void*), void (*release)(void*), void* context);

template <typename Wait, typename Release>
int wait_cancellably(Wait wait, Release release) {
    struct Context {
        Wait& wait;
        Release& release;
    } context{wait, release};
    return wait_cancellably([](void* opaque) { return static_cast<Context*>(opaque)->wait(); },
                            [](void* opaque) { static_cast<Context*>(opaque)->release(); }, &context);
}

}  // namespace tavo
