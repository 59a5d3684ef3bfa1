#pragma once

#include "platform/database/StudySearch.h"

namespace Kxg
{

/// Which table has a column: those of studies, their texts and modalities, series, what series were requested for, files.
enum class Where { Study, Words, Modality, Series, Request, Image };

/// Where the database has what is searched for.
struct Column
{
    const char* name;  // as it is compared, or sorted by; null: neither
    Where where;
    const char* words;  // its column among the texts that are searched for parts; null: none
};

Column columnOf(SearchColumn column);

}  // namespace Kxg
