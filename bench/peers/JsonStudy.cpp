// All attributes of a study that is kept as DICOM JSON in one gzip file, by simdjson: every element is walked.

#include "GzipFile.h"

#include <simdjson.h>

namespace
{

std::size_t countOf(simdjson::dom::element element)
{
    std::size_t count = 0;
    if (element.is_object()) {
        for (const auto member : element.get_object())
            count += 1 + countOf(member.value);
    } else if (element.is_array()) {
        for (const auto item : element.get_array())
            count += countOf(item);
    }
    return count;
}

}  // namespace

int main(int argc, char* argv[])
{
    if (argc < 2)
        return 0;
    const std::string text = inflatedOf(argv[1], simdjson::SIMDJSON_PADDING);
    simdjson::dom::parser parser;
    simdjson::dom::element study;
    if (parser.parse(text.data(), text.size(), false).get(study) != simdjson::SUCCESS)
        return 1;
    std::printf("%zu members\n", countOf(study));
    return 0;
}
