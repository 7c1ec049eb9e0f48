#include <marubackup-util/mustache.h>

#include <vector>

#include <gtest/gtest.h>

using MARU::Backup::replaceMustache;

namespace {

/** Knows NAME, NESTED, EMPTY and the name without characters. */
bool value(const std::string& name, std::string& value) {
    if (name == "NAME") {
        value = "value";
    } else if (name == "NESTED") {
        value = "{{NAME}}";
    } else if (name.empty()) {
        value = "nameless";
    } else {
        return name == "EMPTY";
    }
    return true;
}

struct Expansion {
    const char* text;
    const char* expected;
};

void expectAll(const std::vector<Expansion>& expansions) {
    for (const Expansion& expansion : expansions) {
        EXPECT_EQ(expansion.expected, replaceMustache(expansion.text, value)) << "of " << expansion.text;
    }
}

} // namespace

TEST(Mustache, ReplacesVariablesAndKeepsTheTextAroundThem) {
    expectAll({{"{{NAME}}", "value"},
               {"/a/{{NAME}}.log", "/a/value.log"},
               {"{{NAME}}{{NAME}}-{{NAME}}", "valuevalue-value"},
               {"a{{EMPTY}}b", "ab"},
               {"{{}}", "nameless"}});
}

TEST(Mustache, LeavesAnUnknownVariableAsItWasWritten) {
    expectAll({{"/store/{{missing}}/x", "/store/{{missing}}/x"},
               {"{{missing}}{{NAME}}{{missing}}", "{{missing}}value{{missing}}"}});
}

TEST(Mustache, TakesANameExactlyAsItStands) {
    expectAll({{"{{ NAME}}", "{{ NAME}}"}, {"{{name}}", "{{name}}"}, {"{{NA}ME}}", "{{NA}ME}}"}});
}

TEST(Mustache, DoesNotLookForVariablesInAValue) {
    expectAll({{"{{NESTED}}", "{{NAME}}"}, {"{{{NESTED}}}", "{{{NAME}}}"}, {"{{{{NESTED}}}}", "{{{{NAME}}}}"}});
}

TEST(Mustache, TakesANameFromTheLastOpeningBraces) {
    expectAll({{"{{a{{NAME}}", "{{avalue"},
               {"{{{NAME}}", "{value"},
               {"{{{NAME}}}", "{value}"},
               {"{\"a\":{{NAME}}}", "{\"a\":value}"},
               {"{{missing{{missing}}NAME}}", "{{missing{{missing}}NAME}}"}});
}

TEST(Mustache, TakesUnbalancedBracesForText) {
    expectAll({{"", ""},
               {"{", "{"},
               {"{{", "{{"},
               {"}}", "}}"},
               {"{{NAME", "{{NAME"},
               {"{{NAME}", "{{NAME}"},
               {"{NAME}", "{NAME}"},
               {"NAME}}", "NAME}}"},
               {"}}{{", "}}{{"},
               {"}}{{NAME}}{{", "}}value{{"},
               {"{{NAME}}}}", "value}}"}});
}

TEST(Mustache, CarriesEveryByteThrough) {
    const std::string bytes("\0\xff\n", 3);
    const auto echo = [](const std::string& name, std::string& value) {
        value = name;
        return true;
    };

    EXPECT_EQ(bytes + bytes + bytes, replaceMustache(bytes + "{{" + bytes + "}}" + bytes, echo));
}

TEST(Mustache, GivesTheMapperAnEmptyTextEachTime) {
    const auto append = [](const std::string& name, std::string& value) {
        value += name;
        return name != "b";
    };

    EXPECT_EQ("a{{b}}c", replaceMustache("{{a}}{{b}}{{c}}", append));
}

TEST(Mustache, CallsNoMapperWhereThereIsNoVariable) {
    const boost::function<bool(const std::string&, std::string&)> none;

    EXPECT_EQ("plain {{text}", replaceMustache("plain {{text}", none));
    EXPECT_THROW(replaceMustache("{{NAME}}", none), boost::bad_function_call);
}

// Each of these takes hours if the text is searched again for every brace.
TEST(Mustache, TakesTimeInProportionToTheText) {
    const std::size_t many = 4 * 1024 * 1024;
    const std::string opening(many, '{');
    const std::string closing(many, '}');
    std::string unknown;
    for (std::size_t i = 0; i < many; ++i) {
        unknown += "{{x}}";
    }

    EXPECT_TRUE(replaceMustache(opening, value) == opening);
    EXPECT_TRUE(replaceMustache(closing, value) == closing);
    EXPECT_TRUE(replaceMustache("{{x" + closing, value) == "{{x" + closing);
    EXPECT_TRUE(replaceMustache(unknown, value) == unknown);
}
