#include "server/http/StrictJson.h"

#include <QJsonDocument>

#include <nlohmann/json.hpp>

#include <set>
#include <string>
#include <vector>

namespace Kdd::Http
{
namespace
{

/// Follows a text for as long as it is JSON and no object in it has two members of one name.
class UniqueMembers : public nlohmann::json_sax<nlohmann::json>
{
public:
    bool start_object(std::size_t /*size*/) override
    {
        mNames.emplace_back();
        return true;
    }
    bool key(string_t& name) override { return mNames.back().insert(name).second; }
    bool end_object() override
    {
        mNames.pop_back();
        return true;
    }

    bool null() override { return true; }
    bool boolean(bool /*value*/) override { return true; }
    bool number_integer(number_integer_t /*value*/) override { return true; }
    bool number_unsigned(number_unsigned_t /*value*/) override { return true; }
    bool number_float(number_float_t /*value*/, const string_t& /*text*/) override { return true; }
    bool string(string_t& /*value*/) override { return true; }
    bool binary(binary_t& /*value*/) override { return true; }
    bool start_array(std::size_t /*size*/) override { return true; }
    bool end_array() override { return true; }
    bool parse_error(std::size_t /*place*/, const std::string& /*last*/,
                     const nlohmann::detail::exception& /*fault*/) override
    {
        return false;
    }

private:
    std::vector<std::set<std::string>> mNames;  // of the objects that are open
};

}  // namespace

bool parseObject(const QByteArray& text, QJsonObject& object)
{
    UniqueMembers members;
    // Before Qt's reader sees it: of two members of one name that keeps one, and never frees what the other holds.
    if (!nlohmann::json::sax_parse(text.cbegin(), text.cend(), &members))
        return false;
    const QJsonDocument document = QJsonDocument::fromJson(text);
    if (!document.isObject())
        return false;
    object = document.object();
    return true;
}

}  // namespace Kdd::Http
