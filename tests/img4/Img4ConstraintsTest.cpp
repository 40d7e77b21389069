// The walk over a dictionary's properties, and the constraints that a leaf certificate carries.
#include "der/DERDecode.h"
#include "tests/img4/TrustDomain.h"
#include "tests/support/MissingArguments.h"

#include <tuple>

#include <gtest/gtest.h>

namespace {

using namespace img4maker;
using namespace signedmanifest;

const Bytes good = property("GOOD", integer(1));

DERReturn count(DERTag tag, const Img4PropertyValue* value, std::uint32_t selector, void* context) {
    EXPECT_EQ(tag, propertyTag("GOOD"));
    EXPECT_EQ(bytesOf(value->content), Bytes{1});
    EXPECT_EQ(selector, 9U);
    ++*static_cast<unsigned*>(context);
    return DERSuccess;
}

TEST(Img4PropertyWalk, judgesEveryPropertyOrSaysWhichIsNone) {
    const Bytes content = sequence({ia5("ABCD"), integer(1)});
    const std::tuple<const char*, Bytes, DERReturn, unsigned> rows[] = {
        {"the same property twice", join({good, good}), DERSuccess, 2},
        {"value that is a SET", join({good, property("ABCD", set({}))}), DERUnexpectedTag, 1},
        {"name that is another", item(propertyTag("ABCE"), content), DERUnexpectedTag, 0},
        {"property in an application tag", item(0x6000000000000000 + fourCC("ABCD"), content), DERUnexpectedTag, 0},
        {"property in a primitive tag", item(0xC000000000000000 + fourCC("ABCD"), content), DERUnexpectedTag, 0},
        {"octets behind the property", item(propertyTag("ABCD"), join({content, content})), DERBufferOverflow, 0},
        {"element cut short", join({good, Bytes{0xFF}}), DERDecodeError, 1},
    };
    for (const auto& [name, dictionary, expected, expectedSeen] : rows) {
        const DERItem view = itemOf(dictionary);
        unsigned seen = 0;
        EXPECT_EQ(Img4DecodeEvaluateDictionaryProperties(&view, 9, count, &seen), expected) << name;
        EXPECT_EQ(seen, expectedSeen) << name;
    }
    const DERItem view = itemOf(good);
    const Img4Record record = {};
    expectNeedsAll(DERParamError, Img4DecodeEvaluateDictionaryProperties, &view, 9, count, nullptr);
    expectNeedsAll(DERParamError, Img4DecodeEvaluateManifestProperties, &record, count, nullptr);
    expectNeedsAll(DERParamError, Img4DecodeEvaluateObjectProperties, &record, count, nullptr);
}

// The constraints of manifest or object alone.
Bytes onManifest(const List& constraints) {
    return set({object("MANP", constraints)});
}

Bytes onObject(const List& constraints) {
    return set({object("OBJP", constraints)});
}

const Bytes data = filler(20);

const std::tuple<const char*, Bytes, DERReturn> constraintCases[] = {
    {"none", set({}), DERSuccess},
    {"BOOLEAN met", onManifest({property("FLAG", boolean(true))}), DERSuccess},
    {"BOOLEAN broken", onManifest({property("FLAG", boolean(false))}), Img4Failure},
    {"INTEGER met", onManifest({property("NUMB", integer(0x1234))}), DERSuccess},
    {"INTEGER of another length", onManifest({property("NUMB", integer(0x12))}), Img4Failure},
    {"OCTET STRING met", onManifest({property("DATA", octets(data))}), DERSuccess},
    {"value of a missing property", onManifest({property("NONE", integer(1))}), DEREndOfSequence},
    {"presence met", onManifest({mustBePresent("TEXT")}), DERSuccess},
    {"presence broken", onManifest({mustBePresent("NONE")}), DEREndOfSequence},
    {"absence met", onManifest({mustBeAbsent("NONE")}), DERSuccess},
    {"absence broken", onManifest({mustBeAbsent("TEXT")}), DERUnexpectedTag},
    {"text, which constrains nothing", onManifest({property("TEXT", ia5("text"))}), DERUnexpectedTag},
    {"primitive [0]", onManifest({property("TEXT", item(DERTagContextPrimitive(0), {}))}), DERUnexpectedTag},
    {"constraint with another name", onManifest({item(propertyTag("FLAG"), sequence({ia5("NUMB"), boolean(true)}))}),
     DERUnexpectedTag},
    {"constraint that is no property", onManifest({integer(1)}), DERDecodeError},
    {"the second broken", onManifest({property("FLAG", boolean(true)), mustBePresent("NONE")}), DEREndOfSequence},
    {"the first broken", onManifest({mustBePresent("NONE"), property("FLAG", boolean(false))}), DEREndOfSequence},
    {"object's met", onObject({property("SIZE", integer(5)), mustBeAbsent("FLAG")}), DERSuccess},
    {"both, the object's broken",
     set({object("MANP", {mustBePresent("TEXT")}), object("OBJP", {mustBeAbsent("SIZE")})}), DERUnexpectedTag},
    {"measurement's that is nothing at all", set({item(propertyTag("manx"), {})}), DERSuccess},
    {"another kind", set({object("KIND", {})}), DERUnexpectedTag},
    {"manifest's in a SEQUENCE", set({property("MANP", sequence({}))}), DERUnexpectedTag},
    {"SEQUENCE", sequence({}), DERUnexpectedTag},
    {"no DER", {0x31}, DERDecodeError},
};

// With a listener the check goes on behind a failure, and comes to the same.
void passOver(const Img4Constraint*, void*) {}

TEST(Img4Constraints, bindManifestAndObject) {
    const Bytes manp = join({property("FLAG", boolean(true)), property("NUMB", integer(0x1234)),
                             property("DATA", octets(data)), property("TEXT", ia5("text"))});
    const Bytes objp = property("SIZE", integer(5));
    for (const auto& [name, certProperties, expected] : constraintCases) {
        SCOPED_TRACE(name);
        Img4Record record = {};
        record.manp = itemOf(manp);
        record.objp = itemOf(objp);
        record.manifest.certProperties = itemOf(certProperties);
        EXPECT_EQ(Img4DecodeEvaluateCertificateProperties(&record), expected);
        EXPECT_EQ(Img4DecodeEvaluateCertificatePropertiesExplained(&record, passOver, nullptr), expected);
    }
}

TEST(Img4Constraints, needPropertiesToBind) {
    const Bytes ofObject = onObject({mustBePresent("SIZE")});
    const Bytes ofManifest = onManifest({mustBeAbsent("FLAG")});
    const Bytes broken = {0xFF};
    Img4Record record = {};
    EXPECT_EQ(Img4DecodeEvaluateCertificateProperties(&record), DERDecodeError);
    expectNeedsAll(DERParamError, Img4DecodeEvaluateCertificateProperties, &record);
    expectNeedsAll(DERParamError, Img4DecodeEvaluateCertificatePropertiesExplained, &record, passOver, nullptr);

    record.manifest.certProperties = itemOf(ofObject);
    EXPECT_EQ(Img4DecodeEvaluateCertificateProperties(&record), DERSuccess) << "no object was evaluated";
    record.objp = {broken.data(), 0};
    EXPECT_EQ(Img4DecodeEvaluateCertificateProperties(&record), DERSuccess) << "an object without properties";

    record.manifest.certProperties = itemOf(ofManifest);
    record.manp = itemOf(broken);
    EXPECT_EQ(Img4DecodeEvaluateCertificateProperties(&record), DERDecodeError) << "a search that fails finds nothing";
}

} // namespace
