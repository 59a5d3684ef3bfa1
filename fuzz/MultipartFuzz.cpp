// Multipart bodies as clients send them. However they are cut into packets, the same parts come of them.

#include "fuzz/Property.h"
#include "server/http/ContentType.h"
#include "server/http/MultipartReader.h"

using namespace Kdd;
using namespace Kdd::Http;

namespace
{

class Parts : public MultipartReader::Receiver
{
public:
    bool beginPart(const QVector<Field>& headers) override
    {
        require(!mIsInside, "parts do not nest");
        mIsInside = true;
        text += "<";
        for (const Field& field : headers)
            text += field.name + ':' + field.value + '|';
        return ++mCount < 1000;
    }
    void takePart(const char* bytes, int size) override
    {
        require(mIsInside && size > 0, "bytes belong to a part");
        text.append(bytes, size);
    }
    void endPart() override
    {
        require(mIsInside, "a part ends once");
        mIsInside = false;
        text += ">";
    }

    QByteArray text;

private:
    bool mIsInside = false;
    int mCount = 0;
};

QByteArray read(const QByteArray& boundary, const QByteArray& body, int step)
{
    Parts parts;
    MultipartReader reader(boundary, parts);
    for (int at = 0; at < body.size(); at += step)
        if (!reader.add(body.constData() + at, qMin(step, body.size() - at)))
            break;
    return parts.text + (reader.isComplete() ? "." : reader.fault().isEmpty() ? "?" : "!");
}

}  // namespace

/// The first line is the type of the body, which is all that follows.
extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, std::size_t size)
{
    const QByteArray input = bytesOf(data, size);
    const int line = qMax(0, input.indexOf('\n'));
    const QByteArray boundary = ContentType::parse(input.left(line)).parameter("boundary");
    const QByteArray body = input.mid(line + 1);
    if (boundary.isEmpty() || boundary.size() > 200)
        return 0;
    const QByteArray whole = read(boundary, body, qMax(1, body.size()));
    // One that fails may have handed on more or less of the part that it fails in.
    if (!whole.endsWith('!')) {
        require(read(boundary, body, 1) == whole, "single bytes make the same parts");
        require(read(boundary, body, 7) == whole, "so do seven at a time");
    }
    return 0;
}
