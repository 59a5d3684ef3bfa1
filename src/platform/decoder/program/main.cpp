#include "platform/decoder/program/Confinement.h"
#include "platform/decoder/program/Work.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/oflog/oflog.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstring>
#include <optional>

namespace Kdd
{
namespace
{

std::optional<DecoderKind> kindOf(int argc, char** argv)
{
    for (const DecoderKind kind : {DecoderKind::Frames, DecoderKind::Videos, DecoderKind::VolumeFiles}) {
        if (argc == 2 && std::strcmp(argv[1], nameOf(kind)) == 0)
            return kind;
    }
    return {};
}

bool isSocket(int descriptor)
{
    struct stat status = {};
    return ::fstat(descriptor, &status) == 0 && S_ISSOCK(status.st_mode);
}

int run(DecoderKind kind)
{
    // What the libraries think of damaged input is said once, by whoever gave it.
    OFLog::configure(OFLogger::OFF_LOG_LEVEL);
    DecoderChannel channel(kDecoderSocket);
    Result result = prepareFor(kind);
    if (result.good())
        result = confine();
    DecoderMessage ready;
    if (result.good()) {
        ready.word = DecoderWord::Ready;
        ready.head = bytesOf(kDecoderProtocol);
    } else {
        ready.head = result.text().toUtf8().left(DecoderChannel::kMaxHead);
    }
    if (channel.send(ready) == DecoderChannel::Outcome::Done && result.good())
        work(channel);
    return result.good() ? 0 : 1;
}

}  // namespace
}  // namespace Kdd

int main(int argc, char** argv)
{
    const auto kind = Kdd::kindOf(argc, argv);
    if (!kind || !Kdd::isSocket(Kdd::kDecoderSocket)) {
        constexpr char kText[] =
            "kdd-decoder is started by the kddlib library, to decode where a fault does no harm\n";
        (void)!::write(STDERR_FILENO, kText, sizeof kText - 1);
        return 2;
    }
    // Nothing is tidied up: what a broken library left behind is not to be touched again.
    ::_exit(Kdd::run(*kind));
}
