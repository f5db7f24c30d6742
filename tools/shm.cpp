// tavo shm: makes, fills, shows and deletes shared-memory blocks.
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "tavo_osal/shared_memory.h"
#include "tools/command.h"
#include "tools/files.h"
#include "tools/hexdump.h"
#include "tools/numbers.h"
#include "tools/service.h"
#include "tools/stop_signals.h"

namespace tavo::tool {
namespace {

struct Options {
    std::string key;
    std::string size;
    std::string offset = "0";
    std::string text;
    bool has_text = false;
    std::string file;
};

constexpr uint64_t kLargestBlock = INT32_MAX;

// Maps a block for as long as it lives, and gives its use back then unless the block is to stay.
class Block {
public:
    Block(int key, uint64_t size) : size_(size) {
        if (tavo_shm_init(static_cast<uint32_t>(key), &handle_, static_cast<uint32_t>(size)) != TAVO_SUCCESS) {
            throw Failure("no memory is left for a handle");
        }
        const TAVO_Status status = tavo_shm_acquire(handle_, &address_);
        if (status == TAVO_SUCCESS) return;
        kept_ = handle_;
        throw Failure("the service could not provide a block of " + std::to_string(size) +
                      " bytes: " + describe_status(status));
    }
    ~Block() {
        tavo_shm_release(address_);
        if (kept_ != handle_) tavo_shm_delete(handle_);
    }
    Block(const Block&) = delete;
    Block& operator=(const Block&) = delete;

    // Its use stays counted when the process has ended: the service keeps the block.
    void keep() { kept_ = handle_; }
    char* data() const { return static_cast<char*>(address_); }
    uint64_t size() const { return size_; }

private:
    static inline TavoShmHandle* kept_ = nullptr;  // only deleting would free a handle
    TavoShmHandle* handle_ = nullptr;
    void* address_ = nullptr;
    const uint64_t size_;
};

// What the service has of this key; throws Failure when it is nothing. Acquiring would make a block.
BlockFigures existing(const std::string& text) {
    const int key = parse_key(text);
    const ServiceFigures figures = figures_of(find_service());
    const BlockFigures* block = find_block(figures, key);
    if (block == nullptr) {
        throw Failure("the service has no block " + text + ": make it with 'tavo shm create " + text + " SIZE'");
    }
    return *block;
}

struct Range {
    size_t offset;
    size_t size;
};

// The part of a block that was asked for; everything behind the offset when no size was given.
Range range_in(const BlockFigures& block, const Options& options) {
    const auto size = static_cast<uint64_t>(block.size);
    const uint64_t offset = parse_size(options.offset);
    if (offset > size)
        throw Failure("offset " + options.offset + " lies behind the end of the block, which has " +
                      std::to_string(size) + " bytes");
    if (options.size.empty()) return {static_cast<size_t>(offset), static_cast<size_t>(size - offset)};
    const uint64_t wanted = parse_size(options.size);
    if (wanted > size - offset) {
        throw Failure("the block has only " + std::to_string(size - offset) + " bytes from there on, not " +
                      options.size);
    }
    return {static_cast<size_t>(offset), static_cast<size_t>(wanted)};
}

int create(const Options& options) {
    const int key = parse_key(options.key);
    const uint64_t size = parse_size(options.size);
    if (size == 0 || size > kLargestBlock) throw Misuse("a block has 1 to 2147483647 bytes, not " + options.size);
    const ServiceFigures figures = figures_of(find_service());
    if (const BlockFigures* block = find_block(figures, key)) {
        throw Failure("block " + options.key + " is there already, with " + std::to_string(block->size) +
                      " bytes: delete it first, or take another key");
    }
    if (key < 0) say("note: the service deletes no blocks of negative keys, so this one stays until the service ends");
    Block block(key, size);
    block.keep();
    return kDone;
}

std::string input_for(const Options& options, size_t limit) {
    const bool is_input = options.has_text && options.text == "-" && options.file.empty();
    if (!is_input && options.has_text == !options.file.empty()) {
        throw Misuse("write what? A TEXT, a file (--file FILE) or standard input (-)");
    }
    if (options.has_text && !is_input) return options.text;
    const StopSignals signals;
    std::string bytes = Input(is_input ? "-" : options.file).read_up_to(limit + 1);
    if (StopSignals::received() != 0) throw Failure("stopped before anything was written");
    return bytes;
}

int write(const Options& options) {
    const BlockFigures figures = existing(options.key);
    const Range range = range_in(figures, options);
    const std::string bytes = input_for(options, range.size);
    if (bytes.size() > range.size) {
        throw Failure("that is more than the " + std::to_string(range.size) +
                      " bytes that the block has from there on: nothing was written");
    }
    const Block block(figures.key, static_cast<uint64_t>(figures.size));
    memcpy(block.data() + range.offset, bytes.data(), bytes.size());
    return kDone;
}

int output(const Options& options, bool as_hexadecimal) {
    const BlockFigures figures = existing(options.key);
    const Range range = range_in(figures, options);
    const Block block(figures.key, static_cast<uint64_t>(figures.size));
    const bool written = as_hexadecimal ? write_hexdump(block.data() + range.offset, range.offset, range.size)
                                        : write_all(STDOUT_FILENO, block.data() + range.offset, range.size);
    if (!written) throw Failure(std::string("standard output cannot be written to: ") + strerror(errno));
    return kDone;
}

int read(const Options& options) { return output(options, false); }
int hexdump(const Options& options) { return output(options, true); }

int remove(const Options& options) {
    const BlockFigures figures = existing(options.key);
    if (figures.key < 0) {
        throw Failure("the service deletes no blocks of negative keys: this one stays until the service ends");
    }
    TavoShmHandle* handle = nullptr;
    TAVO_Status status = tavo_shm_init(static_cast<uint32_t>(figures.key), &handle, 1);
    if (status == TAVO_SUCCESS) status = tavo_shm_delete(handle);
    if (status != TAVO_SUCCESS) throw Failure("deleting block " + options.key + " failed: " + describe_status(status));
    if (figures.uses > 1) {
        say("note: block " + options.key + " is still there: " + std::to_string(figures.uses - 1) +
            " more uses of it "
            "are counted");
    }
    return kDone;
}

void add_key(CLI::App& command, const std::shared_ptr<Options>& options) {
    command.add_option("KEY", options->key, "The block's key, any whole number but 0")->required();
}

void add_offset(CLI::App& command, const std::shared_ptr<Options>& options) {
    command.add_option("-o,--offset", options->offset, "Bytes from the block's beginning; 0 without");
}

}  // namespace

void add_shm(CLI::App& app, Run& run) {
    CLI::App* shm = app.add_subcommand("shm", "Works with shared-memory blocks");
    shm->require_subcommand(1);
    CLI::App* command = nullptr;

    auto options = add_command<Options>(*shm, run, "create", "Makes a block, filled with zeros", create, command);
    add_key(*command, options);
    command->add_option("SIZE", options->size, "Bytes, with K, M or G behind for powers of 1024")->required();

    options = add_command<Options>(*shm, run, "write", "Writes into a block", write, command);
    add_key(*command, options);
    command->add_option("TEXT", options->text, "What to write; - for standard input")
        ->each([options](const std::string&) { options->has_text = true; });
    command->add_option("-f,--file", options->file, "Write this file; - for standard input");
    add_offset(*command, options);

    const auto add_reader = [&](const char* name, const char* text, int (*action)(const Options&)) {
        const auto range = add_command<Options>(*shm, run, name, text, action, command);
        add_key(*command, range);
        add_offset(*command, range);
        command->add_option("-s,--size", range->size, "Bytes; all up to the block's end without");
    };
    add_reader("read", "Writes a block's bytes to standard output", read);
    add_reader("hexdump", "Shows a block's bytes in hexadecimal", hexdump);

    options = add_command<Options>(*shm, run, "delete", "Takes back one use of a block; the last one ends it", remove,
                                   command);
    add_key(*command, options);
}

}  // namespace tavo::tool
