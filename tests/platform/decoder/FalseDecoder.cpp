// A decoder that somebody has taken over, or that is about to end: what it does is what its file is called.

#include <dirent.h>
#include <sys/socket.h>
#include <unistd.h>

#include <array>
#include <csignal>
#include <cstdint>
#include <cstdlib>
#include <fstream>
#include <map>
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

/// What is told of a frame: its size, its samples, type, colour and how often it was halved; and its pixels. Right for the
/// test's question are two pixels, of one byte each.
const std::map<std::string, std::pair<std::vector<std::int32_t>, const char*>> kFrames = {
    {"honest", {{2, 1, 1, 0, 0, 0}, "ab"}},       {"once-dead", {{2, 1, 1, 0, 0, 0}, "ab"}},
    {"wide", {{3, 1, 1, 0, 0, 0}, "abc"}},        {"negative", {{2, -1, 1, 0, 0, 0}, "ab"}},
    {"many-samples", {{2, 1, 3, 0, 0, 0}, "ab"}}, {"other-type", {{2, 1, 1, 2, 0, 0}, "ab"}},
    {"no-type", {{2, 1, 1, 77, 0, 0}, "ab"}},     {"other-colour", {{2, 1, 1, 0, 2, 0}, "ab"}},
    {"reduced", {{1, 1, 1, 0, 0, 1}, "a"}},       {"short-pixels", {{2, 1, 1, 0, 0, 0}, "a"}},
    {"long-pixels", {{2, 1, 1, 0, 0, 0}, "abc"}},
};

/// Answers of which nothing follows.
const std::map<std::string, Start> kStarts = {
    {"huge-head", {kDone, 0xffffffff, 0}},
    {"huge-data", {kDone, 24, std::int64_t(1) << 62}},
    {"negative-data", {kDone, 24, -1}},
    {"other-word", {4711, 0, 0}},
};

/// Bytes of the source that it asks for.
const std::map<std::string, std::array<std::int64_t, 2>> kRanges = {
    {"wants", {0, 1}}, {"wants-before", {-1, 1}}, {"wants-all", {0, std::int64_t(1) << 40}}};

template <typename Numbers>
std::string bytesOf(const Numbers& numbers)
{
    return {reinterpret_cast<const char*>(numbers.data()), numbers.size() * sizeof numbers[0]};
}

void answer(const std::string& what, const std::string& file)
{
    if (const auto frame = kFrames.find(what); frame != kFrames.end())
        say(kDone, bytesOf(frame->second.first), frame->second.second);
    else if (const auto start = kStarts.find(what); start != kStarts.end())
        put(&start->second, sizeof start->second);
    else if (const auto range = kRanges.find(what); range != kRanges.end())
        say(kWanted, bytesOf(range->second));
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
    else if (what == "short-head")
        say(kDone, "x", "ab");
    else if (what == "half")
        put(file.data(), 3), std::_Exit(0);
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
