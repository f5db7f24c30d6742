"""What the page says in words. The figures decide which of the reasons are printed: those of peers that were ahead."""

INTRODUCTION = (
    "How this library's queues, calls, log and locks do beside others that one might take instead, and beside the bare platform "
    "call that each stands on. This page and its pictures are made by `./dev bench --peers`; they are not edited by hand.")

HOW_TO_READ = """\
## How to run and read it

`./dev bench --peers` installs what it needs (Debian's packages of the peers), builds, measures for some minutes, and writes this page.
With `--quick` it takes half a minute, and the page goes to `build/benchmarks` instead, as it does where only some families are named.

Every peer has one process or two of its own. All peers take turns within every round, and each round begins with another one, so that a
machine whose speed drifts, or that does other work, slows all of them down; run as root, they also go before that work.
The processes are started anew several times, because where memory happens to lie makes one faster than the next. **The figures to trust are the ratios**: a peer's time by
the bare limit's in the same round. A cell has the median of the rounds' ratios, the quartiles in brackets (a quarter of the rounds was
below the first one, a quarter above the second one), and the median time of one operation. Below 1 is faster than the bare limit, which is the
plainest way of using the platform's call and not the fastest.

On one CPU, both sides share a processor, and a wait is a change of process. On two CPUs each side has its own, and a wait is another
processor's sleep and awakening; the libraries' own threads share the CPU of their side.

What is sent is written anew for each message and looked at when it has come; both sides' counts and checksums are compared after every
round, and a run in which they differ fails.""".splitlines()

FAMILIES = {
    "queues": """\
Two processes, a queue in each direction. A round trip is a message there and one back; a stream is messages in one direction, timed
until the last has been looked at. The bare limit is a pipe of the default size (64 KiB) that carries the same frames as this library's queue:
one write of length and message, two reads. TAVO queue is used as by any client: attached by key, the service in a third process. To a pipe
it adds a buffer for each message put, into which the message is copied behind its length, and the cost of every call in a process that
has a second thread, as clients of the service do: the kernel then counts each use of a descriptor.

- POSIX mq: as many messages as an ordinary user may have (`msg_max`). System V: the default limits.
- SEQPACKET: a pair of Unix-domain sockets.
- Boost.Interprocess: `message_queue`, with room for 1 MiB of messages (at least 16, at most 1,024).
- ZeroMQ: PAIR over `ipc://`, messages written where they are sent from. nng: the same, with buffers for 128 messages.""".splitlines(),
    "calls": """\
A request to another process, and an answer with as many bytes. The bare limit is a pair of Unix-domain stream sockets: one send and one
receive on each side. TAVO binder is libbinder's socket driver, on which this library's service runs on Linux. sd-bus is connected directly,
peer to peer, with no bus daemon in between.""".splitlines(),
    "logging": """\
Lines with a number in them into a file in memory; what came there is read again after each round. The bare limit of a written line is
`snprintf` and `write`, without time or tag. All others write tag, level, time, process and thread. TAVO log goes to Android's liblog, in Debian's
build of it, as on Linux it always does; liblog is that alone. spdlog is measured twice: with each line written when the call returns, as
the others do, and with the buffer it has by default.

A dropped line is one below the level that is logged; its bare limit is comparing the level in line.""".splitlines(),
    "locks": """\
A mutex taken and given back by one thread, or by two that fight over it; semaphores and events that two threads, or two processes, hand
to each other and back. What they guard is counted, and has to add up.""".splitlines(),
}

# By family, operation (None: any other) and peer.
REASONS = {
    ("queues", "round trip", "bare pipe of 1 MiB"):
        "It is a bare pipe like the limit; what this library adds to one is told under Queues.",
    ("queues", None, "bare pipe of 1 MiB"):
        "It holds more, so that the two sides take turns less often. This library's queue grows to 16 of the messages put, 1 MiB at "
        "most: what a user may have in pipes is limited.",
    ("queues", None, "POSIX mq"):
        "The kernel keeps the messages apart: receiving is one call, where a pipe's takes one for the length and one for the message, "
        "and a receiver that waits is handed the message itself. Android has no POSIX queues, and they end at 8 KiB here.",
    ("queues", None, "System V"):
        "The kernel keeps the messages apart: receiving is one call, where a pipe's takes one for the length and one for the message. "
        "Android has no System V queues, and they end at 8 KiB here.",
    ("queues", None, "SEQPACKET"):
        "The kernel keeps the messages apart, so that receiving is one call, and has large ones in a few large pieces, where a pipe "
        "takes memory page by page.",
    ("queues", "round trip", "Boost.Interprocess"):
        "Messages lie in shared memory: no system call copies them, and there is one only to wait or to wake. A process that is killed "
        "inside leaves the queue locked for ever; nothing can wait for it together with other things, as it has no descriptor.",
    ("queues", None, "Boost.Interprocess"):
        "Messages lie in shared memory: while neither side has to wait there is no system call at all. A process that is killed inside "
        "leaves the queue locked for ever; nothing can wait for it together with other things, as it has no descriptor.",
    ("queues", None, "ZeroMQ"):
        "A thread of its own gathers many small messages into one write, and reads as many at once. That thread is what its round trips "
        "pay for, and messages that it has gathered go with a process that is killed.",
    ("queues", None, "nng"):
        "Threads of its own write and read ahead while the program is busy with its messages.",
    ("calls", None, "sd-bus"):
        "The memory of large parcels is new in every call, because the C library gives blocks of their size back to the system when the "
        "call is over. Clearing it anew is most of the difference.",
    ("logging", None, "liblog"):
        "It is what TAVO log is written with. On the way there, the level and the module are looked at and the line's number is put in front.",
    ("logging", None, "spdlog, flushed"):
        "It formats a line once, and works the date out once a second. A line of TAVO log is formatted twice, with its number and then "
        "by liblog, which works the date out for every line and asks the kernel for the thread.",
    ("logging", None, "spdlog, buffered"):
        "Lines are gathered and written together. Those not yet written are lost with a process that is killed, when they matter most; "
        "TAVO log has written every line when the call returns.",
    ("logging", None, "spdlog"):
        "It compares the level in line, without a call.",
    ("locks", None, "std::mutex"):
        "It is the pthread mutex, called in line. This library's is a call more, which looks at the handle and at the result.",
    ("locks", None, "std::condition_variable"):
        "It is the pthread condition, called in line. An event also keeps threads from being cancelled while it holds its lock.",
    ("locks", None, "Boost.Interprocess semaphore"):
        "It is `sem_t`, called in line.",
    ("locks", None, "sem_open"):
        "It is `sem_t`, called without a function in between.",
}


def why(family, operation, peer):
    for of_operation in (operation, None):
        if (family, of_operation, peer) in REASONS:
            return REASONS[family, of_operation, peer]
    return "Not looked into yet."
