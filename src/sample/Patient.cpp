#include "sample/Patient.h"

#include "sample/Dataset.h"
#include "sample/Random.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcdeftag.h>

#include <iterator>

namespace Kdd
{

namespace
{

// That of the day of the studies.
constexpr int kThisYear = 2024;

struct Person
{
    const char* name;
    const char* sex;
};

// What is written in one character set; the sets of studies take the persons in turn.
struct Records
{
    Person persons[3];
    const char* address;
    const char* comments;
    const char* physician;
};

// In the order of the character sets.
const Records kRecords[] = {
    {{{"Baker^Thomas^James^Mr.^Jr.", "M"}, {"Carter^Alice", "F"}, {"Fisher^Edward^Lee", "M"}},
     "12 Mill Lane, Northfield",
     "Walks with a stick",
     "Cooper^Helen^^Dr."},
    {{{"Müller^Jörg^Günther^Dr.", "M"}, {"Lefèvre^Zoé", "F"}, {"Åström^Björn", "M"}},
     "Gärtnerstraße 7, 80000 Tannenbrück",
     "Trägt ein Hörgerät, bitte laut und deutlich sprechen",
     "Weiß^Käthe^^Dr."},
    {{{"Διονυσίου^Ελένη", "F"}, {"Παππά^Μαρία", "F"}, {"Ιωάννου^Σοφία", "F"}},
     "Οδός Ερμού 3, Αθήνα",
     "Προηγούμενη εξέταση πριν δύο χρόνια",
     "Νικολάου^Πέτρος"},
    {{{"Иванова^Мария^Петровна", "F"}, {"Семёнов^Пётр^Ильич", "M"}, {"Щукин^Юрий", "M"}},
     "ул. Садовая 15, Ясногорск",
     "Боится закрытых помещений",
     "Жуков^Андрей^Львович"},
    // Letters, ideographs and their sound, the three groups of a Japanese name.
    {{{"Yamada^Tarou=山田^太郎=やまだ^たろう", "M"},
      {"Nakamura^Hanako=中村^花子=なかむら^はなこ", "F"},
      {"Suzuki^Ichirou=鈴木^一郎=すずき^いちろう", "M"}},
     "山田 1-2-3",
     "おなか の いたみ",
     "Suzuki^Hanako=鈴木^花子"},
    {{{"Nguyễn^Thị Hoa=阮^氏花", "F"}, {"Kowalczyk^Łukasz", "M"}, {"Öztürk^Işıl", "F"}},
     "Phố Huế 18, Hà Nội",
     "Sống một mình",
     "Wiśniewska^Żaneta"},
};

void addRecords(SamplePatient& patient, int set)
{
    const Records& records = kRecords[static_cast<int>(patient.charset)];
    // Another set of studies has another person with the same address.
    const Person& person = records.persons[(set - 1) % static_cast<int>(std::size(records.persons))];
    patient.name = inCharset(patient.charset, person.name);
    patient.sex = person.sex;
    patient.address = inCharset(patient.charset, records.address);
    patient.comments = inCharset(patient.charset, records.comments);
    patient.physician = inCharset(patient.charset, records.physician);
}

QByteArray twoDigits(int number)
{
    return QByteArray::number(number).rightJustified(2, '0');
}

}  // namespace

SamplePatient samplePatient(unsigned seed, int set, SampleCharset charset)
{
    SamplePatient patient;
    patient.charset = charset;
    addRecords(patient, set);

    // Numbered through all sets, so that no two patients share an identifier.
    const int number = (set - 1) * static_cast<int>(std::size(kRecords)) + static_cast<int>(charset) + 1;
    SampleRandom random("patient " + QByteArray::number(number) + " of " + QByteArray::number(seed));
    const int age = random.between(21, 88);
    patient.id = "P" + QByteArray::number(random.between(100, 999)) +
                 QByteArray::number(number).rightJustified(5, '0');
    // Born before the day of the studies in the year, so that the age is the difference of the years.
    patient.birthDate = QByteArray::number(kThisYear - age) + twoDigits(random.between(1, 4)) +
                        twoDigits(random.between(1, 28));
    patient.age = QByteArray::number(age).rightJustified(3, '0') + "Y";
    patient.size = decimal(random.between(152, 195) / 100.0, 2);
    patient.weight = QByteArray::number(random.between(48, 104));
    return patient;
}

void SamplePatient::describe(SampleDataset& dataset) const
{
    // ASCII is what a dataset has that does not say.
    if (charset != SampleCharset::Ascii)
        dataset.with(DCM_SpecificCharacterSet, specificCharacterSet(charset));
    dataset.with(DCM_PatientName, name)
        .with(DCM_PatientID, id)
        .with(DCM_IssuerOfPatientID, "SAMPLE CLINIC")
        .with(DCM_PatientBirthDate, birthDate)
        .with(DCM_PatientSex, sex)
        .with(DCM_PatientAge, age)
        .with(DCM_PatientSize, size)
        .with(DCM_PatientWeight, weight)
        .with(DCM_PatientAddress, address)
        .with(DCM_PatientComments, comments)
        // Empty values, which have to stay empty and not to vanish.
        .with(DCM_EthnicGroup, "")
        .with(DCM_AdditionalPatientHistory, "")
        .with(DCM_PatientState, "")
        .with(DCM_ReferringPhysicianName, physician);
}

}  // namespace Kdd
