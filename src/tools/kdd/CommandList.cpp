#include "tools/kdd/Commands.h"

namespace Kdd
{

/// One line for each command, in the order in which the help lists them: NAMECommand.cpp has `declareNAME`.
#define KDD_EACH_COMMAND(DO)                                                                                 \
    DO(Add)                                                                                                  \
    DO(Index)                                                                                                \
    DO(Build)                                                                                                \
    DO(Stack)                                                                                                \
    DO(List)                                                                                                 \
    DO(Show)                                                                                                 \
    DO(Metadata)                                                                                             \
    DO(Stat)                                                                                                 \
    DO(Previews)                                                                                             \
    DO(Sync)                                                                                                 \
    DO(Correction)                                                                                           \
    DO(Delete)                                                                                               \
    DO(Verify)                                                                                               \
    DO(Diff)                                                                                                 \
    DO(Get)                                                                                                  \
    DO(Put)                                                                                                  \
    DO(Serve)                                                                                                \
    DO(Receive)                                                                                              \
    DO(Sample)

#define KDD_NAME(NAME) void declare##NAME(CommandSet& commands);
KDD_EACH_COMMAND(KDD_NAME)
#undef KDD_NAME

void declareCommands(CommandSet& commands)
{
#define KDD_DECLARE(NAME) declare##NAME(commands);
    KDD_EACH_COMMAND(KDD_DECLARE)
#undef KDD_DECLARE
}

}  // namespace Kdd
