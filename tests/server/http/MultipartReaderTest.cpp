#include "server/http/MultipartReader.h"

#include "server/http/ContentType.h"

#include <gtest/gtest.h>

using namespace Kdd;
using namespace Kdd::Http;

namespace
{

/// Each part as "(header)body".
class Parts : public MultipartReader::Receiver
{
public:
    bool beginPart(const QVector<Field>& headers) override
    {
        text += '(';
        for (const Field& field : headers)
            text += field.name + '=' + field.value;
        text += ')';
        return ++mCount <= 3;
    }
    void takePart(const char* bytes, int size) override { text.append(bytes, size); }
    void endPart() override { text += ';'; }

    QByteArray text;

private:
    int mCount = 0;
};

struct Read
{
    std::string parts;
    bool isComplete = false;
    std::string fault;
};

Read read(const QByteArray& body, int step)
{
    Parts parts;
    MultipartReader reader("ab", parts);
    for (int at = 0; at < body.size(); at += step)
        if (!reader.add(body.constData() + at, qMin(step, body.size() - at)))
            break;
    return {parts.text.toStdString(), reader.isComplete(), reader.fault().toStdString()};
}

const QByteArray kOne = "--ab\r\nA: b\r\n\r\n";

const std::tuple<QByteArray, const char*, bool> kBodies[] = {
    {kOne + "x\r\n--ab--\r\nepilogue --ab\r\n", "(a=b)x;", true},
    {"\r\n" + kOne + "x\r\n--ab--", "(a=b)x;", true},
    {"preamble --ab\r\n--abc\r\n" + kOne + "x\r\n--ab--", "(a=b)x;", true},
    {kOne + "x\r\n--ab \t\r\nC:d\r\n\r\ny\r\n--ab--", "(a=b)x;(c=d)y;", true},
    {kOne + "\r\n\r\n--a\r\n--abc\r\n--ab\n\r\n--ab--", "(a=b)\r\n\r\n--a\r\n--abc\r\n--ab\n;", true},
    {"--ab\r\n\r\nno header\r\n--ab--", "()no header;", true},
    {"--ab\r\nA: b\r\n c\r\n\r\n\r\n--ab--", "(a=b c);", true},
    {"--ab--", "", true},
    {kOne + "x\r\n--ab", "(a=b)x", false},
    {kOne + "half\r\n--a", "(a=b)half", false},
    {"--ab\r\nA: b\r\n", "", false},
    {"", "", false},
};

TEST(MultipartReader, FindsThePartsHoweverTheBytesCome)
{
    for (const auto& [body, parts, isComplete] : kBodies) {
        for (const int step : {1, 2, 3, 5, 11, 17, 1000}) {
            const Read found = read(body, step);
            EXPECT_TRUE(found.parts == parts || (!isComplete && found.parts.find(parts) == 0 &&
                                                 body.contains(found.parts.substr(5).c_str())))
                << found.parts << " of " << body.constData() << " by " << step;
            EXPECT_EQ(found.isComplete, isComplete) << body.constData();
            EXPECT_EQ(found.fault, "");
        }
    }
}

TEST(MultipartReader, TakesNoMoreThanItHasTo)
{
    const QByteArray part = "\r\n" + kOne + "x";
    const std::pair<QByteArray, const char*> kHostile[] = {
        {QByteArray(70000, 'x'), "does not begin with a part"},
        {"--ab\r\na: " + QByteArray(20000, 'x'), "header of a part is too large"},
        {"--ab\r\n" + QByteArray("a: b\r\n").repeated(4000) + "\r\n", "header of a part is too large"},
        {part.repeated(5), "more parts"},
    };
    for (const auto& [body, fault] : kHostile) {
        for (const int step : {1000, 1000000})
            EXPECT_NE(read(body, step).fault.find(fault), std::string::npos) << fault;
    }
}

TEST(ContentType, IsReadWithAndWithoutQuotes)
{
    const std::tuple<const char*, const char*, const char*, const char*> kHeaders[] = {
        {"multipart/related; type=\"application/dicom\"; boundary=abc", "multipart/related",
         "application/dicom", "abc"},
        {"Multipart/Related;Type=application/dicom;Boundary=\"a;b=\\\"c\"", "multipart/related",
         "application/dicom", "a;b=\"c"},
        {"application/dicom", "application/dicom", "", ""},
        {"multipart/related; boundary=\"open", "multipart/related", "", "open"},
        {"nothing; boundary", "", "", ""},
        {"", "", "", ""},
    };
    for (const auto& [header, name, inner, boundary] : kHeaders) {
        const ContentType type = ContentType::parse(header);
        EXPECT_EQ(type.name, name) << header;
        EXPECT_EQ(type.parameter("type"), inner) << header;
        EXPECT_EQ(type.parameter("boundary"), boundary) << header;
    }
}

}  // namespace
