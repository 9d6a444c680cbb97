#include "tests/unit/networkmanager/Verify.h"

// The library's headers are not clean under this project's warnings.
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wold-style-cast"
#pragma GCC diagnostic ignored "-Wcast-qual"
#pragma GCC diagnostic ignored "-Wpedantic"
#pragma GCC diagnostic ignored "-Wconversion"
#pragma GCC diagnostic ignored "-Wsign-conversion"
#include <NetworkManager.h>
#pragma GCC diagnostic pop

namespace testing_support {
namespace {

using namespace platform::bus;

GVariant* toVariant(const Dictionary& dictionary);

struct Converter {
    GVariant* operator()(bool value) const { return g_variant_new_boolean(value ? 1 : 0); }
    GVariant* operator()(std::int32_t value) const { return g_variant_new_int32(value); }
    GVariant* operator()(std::uint32_t value) const { return g_variant_new_uint32(value); }
    GVariant* operator()(std::int64_t value) const { return g_variant_new_int64(value); }
    GVariant* operator()(std::uint64_t value) const { return g_variant_new_uint64(value); }
    GVariant* operator()(const std::string& value) const { return g_variant_new_string(value.c_str()); }
    GVariant* operator()(const Bytes& value) const {
        return g_variant_new_fixed_array(g_variant_type_checked_("y"), value.data(), value.size(), 1);
    }
    GVariant* operator()(const std::vector<std::uint32_t>& value) const {
        return g_variant_new_fixed_array(g_variant_type_checked_("u"), value.data(), value.size(), 4);
    }
    GVariant* operator()(const Texts& value) const {
        GVariantBuilder builder;
        g_variant_builder_init(&builder, g_variant_type_checked_("as"));
        for (const std::string& text : value) {
            g_variant_builder_add(&builder, "s", text.c_str());
        }
        return g_variant_builder_end(&builder);
    }
    GVariant* operator()(const TextMap& value) const {
        GVariantBuilder builder;
        g_variant_builder_init(&builder, g_variant_type_checked_("a{ss}"));
        for (const auto& [key, text] : value) {
            g_variant_builder_add(&builder, "{ss}", key.c_str(), text.c_str());
        }
        return g_variant_builder_end(&builder);
    }
    GVariant* operator()(const std::vector<Dictionary>& value) const {
        GVariantBuilder builder;
        g_variant_builder_init(&builder, g_variant_type_checked_("aa{sv}"));
        for (const Dictionary& dictionary : value) {
            g_variant_builder_add_value(&builder, toVariant(dictionary));
        }
        return g_variant_builder_end(&builder);
    }
};

GVariant* toVariant(const Dictionary& dictionary) {
    GVariantBuilder builder;
    g_variant_builder_init(&builder, g_variant_type_checked_("a{sv}"));
    for (const auto& [key, value] : dictionary) {
        g_variant_builder_add(&builder, "{sv}", key.c_str(), std::visit(Converter(), value.content));
    }
    return g_variant_builder_end(&builder);
}

}  // namespace

std::string verifyProfile(const Sections& profile) {
    GVariantBuilder builder;
    g_variant_builder_init(&builder, g_variant_type_checked_("a{sa{sv}}"));
    for (const auto& [name, section] : profile) {
        g_variant_builder_add(&builder, "{s@a{sv}}", name.c_str(), toVariant(section));
    }
    GVariant* const settings = g_variant_ref_sink(g_variant_builder_end(&builder));
    GError* error = nullptr;
    NMConnection* const connection = nm_simple_connection_new_from_dbus(settings, &error);
    std::string wrong;
    if (connection == nullptr || nm_connection_verify(connection, &error) == 0 ||
        nm_connection_verify_secrets(connection, &error) == 0) {
        wrong = error->message;
        g_error_free(error);
    }
    if (connection != nullptr) {
        g_object_unref(connection);
    }
    g_variant_unref(settings);
    return wrong;
}

}  // namespace testing_support
