// What a search of the list costs in a large archive: 100,000 made-up studies. The database is the one that
// KDD_BENCH_DATABASE names, filled when it is empty, or a file of its own.

#include "platform/database/Schema.h"
#include "platform/database/SearchRows.h"
#include "platform/database/SearchText.h"
#include "platform/database/SqlConnection.h"
#include "platform/database/StudyContent.h"
#include "platform/database/StudySearch.h"

#include <QDate>
#include <QTemporaryDir>

#include <benchmark/benchmark.h>

#include <array>
#include <cstdio>
#include <cstdlib>
#include <random>

namespace Kxg
{

namespace
{

constexpr int kStudies = 100000;
constexpr int kPage = 101;  // what a viewer asks for, and one more

/// Made-up people: families of three syllables and given names of two, few of them frequent, one in fifty in ideographs.
class People
{
public:
    QByteArray name()
    {
        if (pick(50) == 0)
            return "Yamada^Tarou=" + ideograph() + ideograph() + '^' + ideograph();
        return capital(syllable() + syllable() + syllable()) + '^' + capital(syllable() + syllable());
    }

    int pick(int n) { return static_cast<int>(mRandom() % static_cast<unsigned>(n)); }

private:
    QByteArray syllable()
    {
        static const char* const kBegin[] = {"b", "d", "f", "g", "h", "k",   "l",  "m",  "n",  "p",  "r",
                                             "s", "t", "v", "w", "z", "sch", "ch", "st", "br", "kr", "tr"};
        static const char* const kEnd[] = {"a", "e", "i", "o", "u", "er", "an", "en", "el", "in", "ow", "ai"};
        // The smaller of two draws: some are frequent, most are not.
        return QByteArray(kBegin[std::min(pick(22), pick(22))]) + kEnd[std::min(pick(12), pick(12))];
    }
    QByteArray ideograph() { return QString(QChar(0x4E00 + pick(3000))).toUtf8(); }
    static QByteArray capital(QByteArray text)
    {
        text[0] = static_cast<char>(text.at(0) - 'a' + 'A');
        return text;
    }

    std::mt19937 mRandom{7};
};

/// One has nearly all studies, one a hundredth, one ten.
QByteArray institution(int number)
{
    const char* const name = number % 10000 == 0 ? "Tiny" : number % 100 == 0 ? "Small" : "Great";
    return QByteArray(R"({"Value":[")") + name + R"("],"vr":"LO"})";
}

StudySearchRecord madeUp(People& people, int number)
{
    static const std::array<const char*, 20> kModalities = {"CT", "CT", "CT", "CT", "CT", "CR", "CR",
                                                            "CR", "DX", "DX", "DX", "MR", "MR", "MR",
                                                            "MR", "US", "US", "MG", "XA", "PT"};
    static const char* const kRegions[] = {"Head", "Chest", "Abdomen", "Knee left", "Spine", "Pelvis"};
    StudySearchRecord study;
    study.patientName = people.name();
    study.patientID = "PID" + QByteArray::number(people.pick(kStudies * 2 / 3));
    study.date = QDate(2015, 1, 1).addDays(people.pick(4000)).toString(QStringLiteral("yyyyMMdd")).toLatin1();
    study.time = searchTime(QByteArray::number(people.pick(24)).rightJustified(2, '0') + "3015");
    study.accessionNumber = "A" + QByteArray::number(1000000 + number);
    study.referringPhysician = people.name();
    study.description = QByteArray(kRegions[people.pick(6)]) + " with contrast";
    study.studyID = QByteArray::number(number);
    study.patientSex = people.pick(2) == 0 ? "F" : "M";
    study.patientBirthDate = "19600101";
    study.attributes =
        "00100010{\"vr\":\"PN\",\"Value\":[{\"Alphabetic\":\"" + study.patientName + "\"}]}\n" +
        QByteArray("00081030{\"vr\":\"LO\",\"Value\":[\"made up for the bench\"]}\n").repeated(20);
    const QByteArray modality =
        number % 1000 == 0 ? "OPT" : kModalities[static_cast<size_t>(people.pick(20))];
    for (int i = 0; i < 3; ++i) {
        SeriesSearchRecord series;
        series.uid = "1.2.3." + QByteArray::number(number) + '.' + QByteArray::number(i);
        series.modality = modality;
        series.number = QByteArray::number(i);
        series.instances = 100;
        series.attributes = "00080080" + institution(number) + '\n' +
                            QByteArray("0008103E{\"vr\":\"LO\",\"Value\":[\"made up\"]}\n").repeated(10);
        study.series.push_back(series);
    }
    return study;
}

void fill(SqlConnection& connection)
{
    People people;
    TagFileStamp stamp;
    stamp.modified = 1;
    // In one transaction PostgreSQL could never look at the tables anew, and would go on as with empty ones.
    for (int i = 0; i < kStudies;) {
        connection.transact(SqlConnection::Access::Write, [&] {
            for (const int end = i + kStudies / 100; i < end; ++i) {
                const qint64 id = obtainStudy(connection, "1.2.3." + QByteArray::number(i)).id;
                putSearchRows(connection, id, madeUp(people, i), stamp);
            }
        });
        if (i == kStudies / 100)
            connection.execute(QStringLiteral("ANALYZE"));
    }
}

StudySearch& archive()
{
    static QTemporaryDir sFolder;
    // Not closed at the end: what it stands on may be gone by then.
    static StudySearch* sSearch = nullptr;
    if (sSearch != nullptr)
        return *sSearch;
    QByteArray address = qgetenv("KDD_BENCH_DATABASE");
    if (address.isEmpty())
        address = "sqlite:" + sFolder.path().toUtf8() + "/bench.db";
    Kdd::Result result;
    Catalogue::open(address, result);
    sSearch = StudySearch::open(address, result).release();
    std::vector<FoundStudy> found;
    if (sSearch == nullptr || sSearch->studies({}, found).bad())
        std::abort();
    if (found.empty()) {
        DatabaseAddress parsed;
        DatabaseAddress::parse(address, parsed);
        SqlConnection connection(parsed, SqlConnection::IfAbsent::Fail);
        fill(connection);
        connection.execute(QStringLiteral("ANALYZE"));
    }
    return *sSearch;
}

SearchTerm name(const char* pattern)
{
    SearchTerm term;
    term.column = SearchColumn::PatientName;
    term.patterns = namePatterns(QString::fromUtf8(pattern)).patterns;
    return term;
}

SearchTerm is(SearchColumn column, const char* value)
{
    SearchTerm term;
    term.column = column;
    term.values = {value};
    return term;
}

SearchTerm dates(const char* from, const char* to)
{
    SearchTerm term;
    term.column = SearchColumn::StudyDate;
    term.from = from;
    term.to = to;
    return term;
}

using Limits = std::shared_ptr<const StudyLimits>;

void run(benchmark::State& state, const std::vector<SearchTerm>& terms, int offset, SearchColumn order,
         const Limits& limits)
{
    SearchQuery query;
    query.terms = terms;
    query.offset = offset;
    query.limit = kPage;
    if (order != SearchColumn::StudyDate)
        query.order = {{order, false}};
    StudySearch& search = archive();
    search.limitTo(limits);
    QByteArray plan;
    if (qEnvironmentVariableIsSet("KDD_BENCH_PLANS") && search.explainStudies(query, plan).good())
        std::fprintf(stderr, "%s\n", plan.constData());
    std::vector<FoundStudy> found;
    for (auto _ : state) {
        if (search.studies(query, found).bad())
            std::abort();
    }
    state.counters["found"] = static_cast<double>(found.size());
    int count = 0;
    if (search.countStudies(query, kStudies, count).good())
        state.counters["of"] = count;
}

void declare(const char* what, const std::vector<SearchTerm>& terms, int offset = 0,
             SearchColumn order = SearchColumn::StudyDate, const Limits& limits = nullptr)
{
    benchmark::RegisterBenchmark(what, run, terms, offset, order, limits)->Unit(benchmark::kMillisecond);
}

/// Of those who may see the studies of some institutions only.
void declareLimited(const QByteArray& who, const QVector<int>& numbers)
{
    StudyLimit limit{StudyLimit::Of::Series, "00080080", {}};
    for (const int number : numbers)
        limit.values << "00080080" + institution(number);
    const auto limits = std::make_shared<StudyLimits>(StudyLimits{{limit}});
    declare(("limited" + who + "/newest").constData(), {}, 0, SearchColumn::StudyDate, limits);
    declare(("limited" + who + "/namePart").constData(), {name("*sch*")}, 0, SearchColumn::StudyDate, limits);
    declare(("limited" + who + "/modality").constData(), {is(SearchColumn::ModalitiesInStudy, "MR")}, 0,
            SearchColumn::StudyDate, limits);
    declare(("limited" + who + "/identifier").constData(), {is(SearchColumn::PatientID, "PID4711")}, 0,
            SearchColumn::StudyDate, limits);
    declare(("limited" + who + "/one").constData(), {is(SearchColumn::StudyUID, "1.2.3.4711")}, 0,
            SearchColumn::StudyDate, limits);
}

const bool kDeclared = [] {
    declare("search/newest", {});
    declare("search/page50", {}, 5000);
    declare("search/namePart", {name("*sch*")});
    declare("search/namePartRare", {name("*schowtra*")});
    declare("search/namePartFrequent", {name("*aba*")});
    declare("search/nameTwoLetters", {name("*wi*")});
    declare("search/nameOneIdeograph", {name("*乁*")});
    declare("search/family", {name("Bababa^*")});
    declare("search/dateRange", {dates("20200101", "20200131")});
    declare("search/nameInYear", {name("*sch*"), dates("20200101", "20201231")});
    declare("search/identifier", {is(SearchColumn::PatientID, "PID4711")});
    declare("search/accession", {is(SearchColumn::AccessionNumber, "A1004711")});
    declare("search/modality", {is(SearchColumn::ModalitiesInStudy, "CT")});
    declare("search/modalityRare", {is(SearchColumn::ModalitiesInStudy, "OPT")});
    declare("search/modalityInYear",
            {is(SearchColumn::ModalitiesInStudy, "OPT"), dates("20200101", "20201231")});
    declare("search/modalityAndName", {is(SearchColumn::ModalitiesInStudy, "MR"), name("*sch*")});
    declare("search/byName", {}, 0, SearchColumn::PatientName);
    declare("search/byPatientID", {}, 5000, SearchColumn::PatientID);
    declare("search/one", {is(SearchColumn::StudyUID, "1.2.3.4711")});
    declareLimited("ToGreat", {1});
    declareLimited("ToSmall", {100});
    declareLimited("ToTiny", {0});
    declareLimited("ToNone", {});
    return true;
}();

}  // namespace

}  // namespace Kxg
