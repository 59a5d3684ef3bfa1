// What clients say they take.

#include "fuzz/Property.h"
#include "server/dicomweb/MediaTypes.h"
#include "server/http/AcceptHeader.h"

using namespace Kdd;
using namespace Kdd::Http;

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, std::size_t size)
{
    const QByteArray text = bytesOf(data, size);
    const AcceptHeader accept(text);
    int last = 1000;
    for (const MediaRange& range : accept.ranges()) {
        require(range.quality >= 0 && range.quality <= last, "qualities are thousandths and fall");
        require(range.name.contains('/'), "a range names a media type");
        require(range.closeness({range.name, range.parts}) > 0, "a range names itself");
        last = range.quality;
    }
    const QVector<MediaType> offers = {{"application/dicom+json", ""},
                                       {"multipart/related", "application/dicom"}};
    const int chosen = accept.choose(offers);
    require(chosen == -1 || accept.quality(offers[chosen]) > 0, "what is refused is not chosen");

    const QVector<QByteArray> others = {"1.2.840.10008.1.2.5", "1.2.840.10008.1.2.4.70"};
    const DicomWeb::PixelOffer offer{"1.2.840.10008.1.2.4.50", true, false, true, others};
    DicomWeb::PixelForm form;
    if (DicomWeb::choosePixelForm(accept, offer, form)) {
        require(!form.isSinglePart, "several parts are not given as one");
        require(form.isStored == (form.transferSyntax == offer.transferSyntax),
                "only the stored ones are as stored");
        require(form.transferSyntax == DicomWeb::kExplicitLittleEndian || form.isStored ||
                    others.contains(form.transferSyntax),
                "nothing is given that is not offered");
    }
    DicomWeb::InstanceForm instance;
    if (DicomWeb::chooseInstanceForm(accept, false, instance)) {
        require(instance.packing != DicomWeb::InstanceForm::Packing::Single, "several are not given as one");
        const QByteArray syntax = instance.syntaxFor(offer.transferSyntax, others);
        require(syntax.isEmpty() || syntax == offer.transferSyntax || others.contains(syntax),
                "it can be given");
    }

    Request request;
    request.headers = {{"accept-encoding", text}};
    acceptsCoding(request, "gzip");
    return 0;
}
