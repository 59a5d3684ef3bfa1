#pragma once

#include "platform/database/StudySearch.h"

namespace Kxg
{

/// Which table has a column: those of studies, texts of studies, series, and what series were requested for.
enum class Where { Study, Words, Series, Request };

/// Where the database has what is searched for.
struct Column
{
    const char* name;  // as it is compared, or sorted by
    Where where;
    const char* words;  // its column among the texts that are searched for parts; null: none
};

Column columnOf(SearchColumn column);

}  // namespace Kxg
