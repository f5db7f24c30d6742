#include "tools/screen.h"

#include <poll.h>
#include <signal.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>

#include "tools/files.h"
#include "tools/stop_signals.h"

namespace tavo::tool {
namespace {

using std::chrono::milliseconds;
using std::chrono::steady_clock;

// The other screen, without a cursor; and back.
constexpr char kEnter[] = "\033[?1049h\033[?25l";
constexpr char kLeave[] = "\033[?25h\033[?1049l";
constexpr char kHome[] = "\033[H";
constexpr char kEndOfLine[] = "\033[K\r\n";
constexpr char kEndOfScreen[] = "\033[K\033[J";

// A signal may be handled on any thread.
std::atomic<bool> g_resized{false};
std::atomic<bool> g_suspended{false};

void note_resize(int) { g_resized = true; }
void note_suspension(int) { g_suspended = true; }

void handle(int signal, void (*handler)(int)) {
    struct sigaction action = {};
    action.sa_handler = handler;
    sigaction(signal, &action, nullptr);
}

void put(const std::string& text) { write_all(STDOUT_FILENO, text.data(), text.size()); }

// As many characters of the line as fit; sequences that only colour take no room.
std::string clip(const std::string& line, size_t width) {
    std::string clipped;
    size_t shown = 0;
    for (size_t i = 0; i < line.size(); ++i) {
        if (line[i] == '\033') {
            const size_t end = std::min(line.find('m', i), line.size() - 1);
            clipped += line.substr(i, end - i + 1);
            i = end;
        } else if (shown < width) {
            clipped += line[i];
            ++shown;
        }
    }
    return clipped;
}

winsize size_of_screen() {
    winsize size = {};
    if (ioctl(STDOUT_FILENO, TIOCGWINSZ, &size) != 0 || size.ws_row == 0 || size.ws_col == 0) size = {24, 80, 0, 0};
    return size;
}

}  // namespace

Screen::Screen() : has_keys_(tcgetattr(STDIN_FILENO, &saved_) == 0) {
    handle(SIGWINCH, note_resize);
    handle(SIGTSTP, note_suspension);
    enter();
}

Screen::~Screen() {
    leave();
    signal(SIGWINCH, SIG_DFL);
    signal(SIGTSTP, SIG_DFL);
}

void Screen::enter() {
    if (has_keys_) {
        termios keys = saved_;
        keys.c_lflag &= ~static_cast<tcflag_t>(ICANON | ECHO);
        tcsetattr(STDIN_FILENO, TCSADRAIN, &keys);
    }
    put(kEnter);
}

void Screen::leave() const {
    put(kLeave);
    if (has_keys_) tcsetattr(STDIN_FILENO, TCSADRAIN, &saved_);
}

void Screen::suspend() {
    g_suspended = false;
    leave();
    raise(SIGSTOP);
    enter();
}

void Screen::draw(const std::string& text) {
    const winsize size = size_of_screen();
    std::string output = kHome;
    size_t begin = 0;
    for (int row = 0; row < size.ws_row && begin < text.size(); ++row) {
        const size_t end = std::min(text.find('\n', begin), text.size());
        if (row > 0) output += kEndOfLine;
        output += clip(text.substr(begin, end - begin), size.ws_col);
        begin = end + 1;
    }
    put(output + kEndOfScreen);
}

Screen::Event Screen::wait_until(steady_clock::time_point time) {
    for (;;) {
        if (g_suspended) {
            suspend();
            return Event::kResized;
        }
        if (g_resized) {
            g_resized = false;
            return Event::kResized;
        }
        const auto left = std::chrono::duration_cast<milliseconds>(time - steady_clock::now());
        pollfd slots[] = {{StopSignals::descriptor(), POLLIN, 0}, {has_keys_ ? STDIN_FILENO : -1, POLLIN, 0}};
        const int ready = poll(slots, 2, static_cast<int>(std::max(left, milliseconds(0)).count()));
        if (StopSignals::received() != 0) return Event::kQuit;
        if (ready == 0) return Event::kTime;
        if (ready < 0 || slots[1].revents == 0) continue;
        char key = 0;
        if (read(STDIN_FILENO, &key, 1) <= 0 || key == 'q' || key == 'Q') return Event::kQuit;
    }
}

}  // namespace tavo::tool
