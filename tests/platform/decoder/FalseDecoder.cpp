// A decoder that somebody has taken over, or that is about to end: what it does is what its file is called.

#include <dirent.h>
#include <sys/socket.h>
#include <unistd.h>

#include <csignal>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <string>
#include <vector>

namespace
{

// Written out here: what the library takes for a message is what is to be tested.
constexpr std::uint32_t kReady = 10;
constexpr std::uint32_t kWanted = 11;
constexpr std::uint32_t kDone = 12;
constexpr std::uint32_t kFailed = 13;

struct Start
{
    std::uint32_t word;
    std::uint32_t head;
    std::int64_t data;
};

void put(const void* bytes, std::size_t size)
{
    (void)!::send(0, bytes, size, MSG_NOSIGNAL);
}

void say(std::uint32_t word, const std::string& head, const std::string& data = {})
{
    const Start start = {word, static_cast<std::uint32_t>(head.size()),
                         static_cast<std::int64_t>(data.size())};
    put(&start, sizeof start);
    put(head.data(), head.size());
    put(data.data(), data.size());
}

void sayStart(std::uint32_t word, std::uint32_t head, std::int64_t data)
{
    const Start start = {word, head, data};
    put(&start, sizeof start);
}

std::string numbers(const std::vector<std::int32_t>& values)
{
    return std::string(reinterpret_cast<const char*>(values.data()), values.size() * sizeof values[0]);
}

std::string range(std::int64_t offset, std::int64_t length)
{
    const std::int64_t both[] = {offset, length};
    return std::string(reinterpret_cast<const char*>(both), sizeof both);
}

/// Reads a question to its end.
void awaitQuestion()
{
    Start start = {};
    if (::recv(0, &start, sizeof start, MSG_WAITALL) != sizeof start)
        std::_Exit(0);
    std::string rest(start.head + static_cast<std::size_t>(start.data), '\0');
    if (!rest.empty() && ::recv(0, rest.data(), rest.size(), MSG_WAITALL) <= 0)
        std::_Exit(0);
}

/// What it was given, as a text: its environment and how many descriptors.
std::string possessions()
{
    std::string text;
    for (char** each = environ; *each != nullptr; ++each)
        text += std::string(*each) + ' ';
    int count = 0;
    DIR* const folder = ::opendir("/proc/self/fd");
    while (::readdir(folder) != nullptr)
        ++count;
    ::closedir(folder);
    // Two names of folders, and the descriptor by which they are read.
    return text + std::to_string(count - 3);
}

/// The frame that is right for the test's question: two pixels, of one byte each.
const std::vector<std::int32_t> kFrame = {2, 1, 1, 0, 0, 0};

std::vector<std::int32_t> frameWith(std::size_t at, std::int32_t value)
{
    std::vector<std::int32_t> frame = kFrame;
    frame[at] = value;
    return frame;
}

void answer(const std::string& what, const std::string& file)
{
    if (what == "honest" || what == "once-dead")
        say(kDone, numbers(kFrame), "ab");
    else if (what == "aborts")
        std::abort();
    else if (what == "hangs" || what == "killed")
        ::pause();
    else if (what == "leaves")
        std::_Exit(7);
    else if (what == "tells")
        say(kFailed, possessions());
    else if (what == "tells-unprintable")
        say(kFailed, "a\nb\x1b[2Jc");
    else if (what == "wide")
        say(kDone, numbers(frameWith(0, 3)), "abc");
    else if (what == "negative")
        say(kDone, numbers(frameWith(1, -1)), "ab");
    else if (what == "many-samples")
        say(kDone, numbers(frameWith(2, 3)), "ab");
    else if (what == "other-type")
        say(kDone, numbers(frameWith(3, 2)), "ab");
    else if (what == "no-type")
        say(kDone, numbers(frameWith(3, 77)), "ab");
    else if (what == "other-colour")
        say(kDone, numbers(frameWith(4, 2)), "ab");
    else if (what == "reduced")
        say(kDone, numbers(frameWith(5, 1)), "a");
    else if (what == "short-pixels")
        say(kDone, numbers(kFrame), "a");
    else if (what == "long-pixels")
        say(kDone, numbers(kFrame), "abc");
    else if (what == "short-head")
        say(kDone, "x", "ab");
    else if (what == "huge-head")
        sayStart(kDone, 0xffffffff, 0);
    else if (what == "huge-data")
        sayStart(kDone, 24, std::int64_t(1) << 62);
    else if (what == "negative-data")
        sayStart(kDone, 24, -1);
    else if (what == "other-word")
        say(4711, {});
    else if (what == "half")
        put(file.data(), 3), std::_Exit(0);
    else if (what == "wants")
        say(kWanted, range(0, 1));
    else if (what == "wants-before")
        say(kWanted, range(-1, 1));
    else if (what == "wants-all")
        say(kWanted, range(0, std::int64_t(1) << 40));
}

}  // namespace

int main(int /*argc*/, char** argv)
{
    const std::string file = argv[0];
    const std::string what = file.substr(file.rfind('/') + 1);
    if (what == "never-ready")
        ::pause();
    if (what == "not-started")
        return 3;
    const std::uint32_t protocol = what == "other-version" ? 99 : 1;
    if (what == "refuses")
        say(kFailed, "it cannot be confined");
    else
        say(kReady, std::string(reinterpret_cast<const char*>(&protocol), sizeof protocol));
    for (;;) {
        awaitQuestion();
        const bool wasThere = std::ifstream(file + ".was").good();
        std::ofstream(file + ".was") << ' ';
        if (what == "once-dead" && !wasThere)
            ::raise(SIGKILL);
        answer(what, file);
    }
}
