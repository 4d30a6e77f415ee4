// Checking a configuration, and reading one from a project file (JSON).
#include "tarvo/Config.h"

#include "platform/text.h"

#include <QFile>
#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>

#include <cmath>
#include <set>

namespace tarvo {

namespace {

std::string Utf8(const std::u16string& text) { return Utf16ToUtf8(text); }

bool Fail(std::string* error, const std::string& message) {
    if (error) *error = message;
    return false;
}

bool ValidateGenerator(const VariableConfig& v, const std::string& where, std::string* error) {
    const GeneratorConfig& g = v.generator;
    if (!(g.periodMs > 0) || !std::isfinite(g.periodMs)) return Fail(error, where + ": period_ms must be above 0");
    if (g.cycleMs == 0) return Fail(error, where + ": cycle_ms must be at least 1");
    for (double d : {g.amplitude, g.offset, g.step, g.minimum, g.maximum, v.number}) {
        if (!std::isfinite(d)) return Fail(error, where + ": numbers must be finite");
    }
    const bool forNumbers = g.kind == GeneratorKind::Sine || g.kind == GeneratorKind::Ramp ||
                            g.kind == GeneratorKind::RandomWalk || g.kind == GeneratorKind::Counter;
    if (forNumbers && v.isText) return Fail(error, where + ": this generator needs a number variable");
    if (g.kind == GeneratorKind::TextCycle) {
        if (!v.isText) return Fail(error, where + ": text_cycle needs a text variable");
        if (g.texts.empty()) return Fail(error, where + ": text_cycle needs at least one text");
    }
    if ((g.kind == GeneratorKind::Ramp || g.kind == GeneratorKind::RandomWalk) && g.minimum > g.maximum)
        return Fail(error, where + ": min must not exceed max");
    return true;
}

bool ValidateProject(ProjectConfig& p, std::string* error) {
    const std::string where = "project '" + Utf8(p.name) + "'";
    std::set<std::u16string> names;
    std::set<LONG> ids;
    for (const VariableConfig& v : p.variables) {
        const std::string at = where + ", variable '" + Utf8(v.name) + "'";
        if (v.name.empty()) return Fail(error, where + ": a variable has no name");
        if (!names.insert(v.name).second) return Fail(error, at + ": the name is used twice");
        if (v.id < 0) return Fail(error, at + ": ids are positive");
        if (v.id != 0 && !ids.insert(v.id).second) return Fail(error, at + ": the id is used twice");
        if (!ValidateGenerator(v, at, error)) return false;
    }
    LONG next = 1;
    for (VariableConfig& v : p.variables) {
        if (v.id != 0) continue;
        while (ids.count(next)) ++next;
        v.id = next;
        ids.insert(next);
    }
    return true;
}

// ---- JSON ------------------------------------------------------------------

class JsonReader {
public:
    explicit JsonReader(std::string* error) : m_error(error) {}

    bool Read(const QJsonObject& root, RuntimeConfig* config) {
        if (!Keys(root, "the file", {"tick_ms", "projects"})) return false;
        if (!Unsigned(root, "tick_ms", "the file", &config->tickMs)) return false;
        if (!root.value("projects").isArray()) return Fail(m_error, "the file: \"projects\" must be an array");
        const QJsonArray projects = root.value("projects").toArray();
        for (qsizetype i = 0; i < projects.size(); ++i) {
            ProjectConfig project;
            if (!ReadProject(projects[i], "projects[" + std::to_string(i) + "]", &project)) return false;
            config->projects.push_back(std::move(project));
        }
        return true;
    }

private:
    bool Keys(const QJsonObject& object, const std::string& where, std::initializer_list<const char*> allowed) {
        for (auto it = object.begin(); it != object.end(); ++it) {
            bool known = false;
            for (const char* key : allowed) known = known || it.key() == QLatin1String(key);
            if (!known) return Fail(m_error, where + ": unknown key \"" + it.key().toStdString() + "\"");
        }
        return true;
    }

    bool Text(const QJsonObject& o, const char* key, const std::string& where, std::u16string* out) {
        if (!o.contains(key)) return true;
        if (!o.value(key).isString()) return Fail(m_error, where + ": \"" + key + "\" must be a text");
        *out = o.value(key).toString().toStdU16String();
        return true;
    }

    bool Number(const QJsonObject& o, const char* key, const std::string& where, double* out) {
        if (!o.contains(key)) return true;
        if (!o.value(key).isDouble()) return Fail(m_error, where + ": \"" + key + "\" must be a number");
        *out = o.value(key).toDouble();
        return true;
    }

    template <typename T>
    bool Unsigned(const QJsonObject& o, const char* key, const std::string& where, T* out) {
        double d = 0;
        if (!o.contains(key)) return true;
        if (!Number(o, key, where, &d)) return false;
        if (d < 0 || d != std::floor(d) || d > 2147483647.0)
            return Fail(m_error, where + ": \"" + key + "\" must be a whole number from 0 to 2147483647");
        *out = static_cast<T>(d);
        return true;
    }

    // A 64-bit status: a whole number, or a text in decimal or 0x-hexadecimal.
    bool Status(const QJsonObject& o, const char* key, const std::string& where, ULONGLONG* out) {
        if (!o.contains(key)) return true;
        const QJsonValue value = o.value(key);
        if (value.isString()) {
            bool ok = false;
            const QString text = value.toString();
            *out = text.startsWith("0x", Qt::CaseInsensitive) ? text.mid(2).toULongLong(&ok, 16)
                                                              : text.toULongLong(&ok, 10);
            if (ok) return true;
        } else if (value.isDouble()) {
            const double d = value.toDouble();
            if (d >= 0 && d == std::floor(d) && d <= 9007199254740992.0) {
                *out = static_cast<ULONGLONG>(d);
                return true;
            }
        }
        return Fail(m_error,
                    where + ": \"" + key + "\" must be a whole number, or a text such as \"0x8000000000000001\"");
    }

    bool ReadProject(const QJsonValue& value, const std::string& where, ProjectConfig* project) {
        if (!value.isObject()) return Fail(m_error, where + ": must be an object");
        const QJsonObject o = value.toObject();
        if (!Keys(o, where, {"name", "active", "variables"})) return false;
        if (!o.value("name").isString()) return Fail(m_error, where + ": \"name\" must be a text");
        project->name = o.value("name").toString().toStdU16String();
        if (o.contains("active")) {
            if (!o.value("active").isBool()) return Fail(m_error, where + ": \"active\" must be true or false");
            project->active = o.value("active").toBool();
        }
        if (!o.value("variables").isArray()) return Fail(m_error, where + ": \"variables\" must be an array");
        const QJsonArray variables = o.value("variables").toArray();
        for (qsizetype i = 0; i < variables.size(); ++i) {
            if (!ReadVariables(variables[i], where + ".variables[" + std::to_string(i) + "]", &project->variables))
                return false;
        }
        return true;
    }

    // One entry: one variable, or several with "repeat" ("{n}" in the name counts 1..repeat).
    bool ReadVariables(const QJsonValue& value, const std::string& where, std::vector<VariableConfig>* out) {
        if (!value.isObject()) return Fail(m_error, where + ": must be an object");
        const QJsonObject o = value.toObject();
        if (!Keys(o, where, {"name", "id", "type", "value", "status", "generator", "repeat", "rate"})) return false;
        VariableConfig v;
        if (!o.value("name").isString()) return Fail(m_error, where + ": \"name\" must be a text");
        v.name = o.value("name").toString().toStdU16String();
        if (!Unsigned(o, "id", where, &v.id)) return false;
        const QString type = o.value("type").toString("number");
        if (type != "number" && type != "text")
            return Fail(m_error, where + ": \"type\" must be \"number\" or \"text\"");
        v.isText = type == "text";
        if (!(v.isText ? Text(o, "value", where, &v.text) : Number(o, "value", where, &v.number))) return false;
        if (!Status(o, "status", where, &v.status)) return false;
        if (o.contains("generator") && !ReadGenerator(o.value("generator"), where + ".generator", &v.generator))
            return false;
        DWORD repeat = 1;
        if (!Unsigned(o, "repeat", where, &repeat)) return false;
        if (repeat == 0 || repeat > 1000000) return Fail(m_error, where + ": \"repeat\" must be from 1 to 1000000");
        const std::u16string counter = u"{n}";
        const size_t at = v.name.find(counter);
        if (repeat > 1 && at == std::u16string::npos) return Fail(m_error, where + ": a repeated name needs \"{n}\"");
        if (v.id != 0 && static_cast<double>(v.id) + repeat - 1 > 2147483647.0)
            return Fail(m_error, where + ": the repeated ids go past 2147483647");
        double rate = 0;
        if (!ReadRate(o, where, repeat, &v.generator, &rate)) return false;
        for (DWORD n = 1; n <= repeat; ++n) {
            VariableConfig copy = v;
            // Spread over one period: every tick carries its share of the rate.
            if (rate > 0) copy.generator.firstChangeMs = n * 1000.0 / rate;
            if (at != std::u16string::npos) copy.name.replace(at, counter.size(), Utf8ToUtf16(std::to_string(n)));
            if (v.id != 0) copy.id = v.id + static_cast<LONG>(n - 1);
            out->push_back(std::move(copy));
        }
        return true;
    }

    // "rate": changes per second of all variables of the entry together; it
    // sets their period and spreads their changes evenly over it.
    bool ReadRate(const QJsonObject& o, const std::string& where, DWORD repeat, GeneratorConfig* g, double* rate) {
        if (!o.contains("rate")) return true;
        if (!Number(o, "rate", where, rate)) return false;
        if (!(*rate > 0) || !std::isfinite(*rate)) return Fail(m_error, where + ": \"rate\" must be above 0");
        if (g->kind == GeneratorKind::Constant)
            return Fail(m_error, where + ": \"rate\" needs a generator that changes");
        if (o.value("generator").toObject().contains("period_ms"))
            return Fail(m_error, where + ": give \"rate\" or the generator's \"period_ms\", not both");
        g->periodMs = repeat * 1000.0 / *rate;
        return true;
    }

    bool ReadGenerator(const QJsonValue& value, const std::string& where, GeneratorConfig* g) {
        if (!value.isObject()) return Fail(m_error, where + ": must be an object");
        const QJsonObject o = value.toObject();
        if (!Keys(o, where,
                  {"kind", "period_ms", "amplitude", "offset", "cycle_ms", "step", "min", "max", "texts", "alt_status",
                   "seed", "stop_ms"}))
            return false;
        static const std::pair<const char*, GeneratorKind> kinds[] = {
            {"constant", GeneratorKind::Constant},
            {"sine", GeneratorKind::Sine},
            {"ramp", GeneratorKind::Ramp},
            {"random_walk", GeneratorKind::RandomWalk},
            {"counter", GeneratorKind::Counter},
            {"text_cycle", GeneratorKind::TextCycle},
            {"status_flip", GeneratorKind::StatusFlip},
        };
        const QString kind = o.value("kind").toString();
        bool known = false;
        for (const auto& [name, k] : kinds) {
            if (kind == QLatin1String(name)) {
                g->kind = k;
                known = true;
            }
        }
        if (!known) return Fail(m_error, where + ": unknown \"kind\" \"" + kind.toStdString() + "\"");
        if (!Unsigned(o, "period_ms", where, &g->periodMs) || !Unsigned(o, "cycle_ms", where, &g->cycleMs) ||
            !Unsigned(o, "seed", where, &g->seed) || !Unsigned(o, "stop_ms", where, &g->stopMs) ||
            !Number(o, "amplitude", where, &g->amplitude) || !Number(o, "offset", where, &g->offset) ||
            !Number(o, "step", where, &g->step) || !Number(o, "min", where, &g->minimum) ||
            !Number(o, "max", where, &g->maximum) || !Status(o, "alt_status", where, &g->alternateStatus))
            return false;
        if (o.contains("texts")) {
            if (!o.value("texts").isArray()) return Fail(m_error, where + ": \"texts\" must be an array of texts");
            for (const QJsonValue& t : o.value("texts").toArray()) {
                if (!t.isString()) return Fail(m_error, where + ": \"texts\" must be an array of texts");
                g->texts.push_back(t.toString().toStdU16String());
            }
        }
        return true;
    }

    std::string* m_error;
};

}  // namespace

bool ValidateConfig(RuntimeConfig& config, std::string* error) {
    if (config.tickMs == 0 || config.tickMs > 60000) return Fail(error, "tick_ms must be from 1 to 60000");
    std::set<std::u16string> names;
    for (ProjectConfig& project : config.projects) {
        if (project.name.empty()) return Fail(error, "a project has no name");
        if (!names.insert(project.name).second)
            return Fail(error, "project '" + Utf8(project.name) + "': the name is used twice");
        if (!ValidateProject(project, error)) return false;
    }
    return true;
}

bool ParseProjectJson(std::string_view json, RuntimeConfig* config, std::string* error) {
    QJsonParseError parseError{};
    const QJsonDocument document =
        QJsonDocument::fromJson(QByteArray(json.data(), static_cast<qsizetype>(json.size())), &parseError);
    if (parseError.error != QJsonParseError::NoError)
        return Fail(error, "not valid JSON at offset " + std::to_string(parseError.offset) + ": " +
                               parseError.errorString().toStdString());
    if (!document.isObject()) return Fail(error, "the file must hold one JSON object");
    RuntimeConfig read;
    if (!JsonReader(error).Read(document.object(), &read) || !ValidateConfig(read, error)) return false;
    *config = std::move(read);
    return true;
}

bool LoadProjectFile(const std::string& path, RuntimeConfig* config, std::string* error) {
    QFile file(QString::fromStdString(path));
    if (!file.open(QIODevice::ReadOnly)) return Fail(error, path + ": " + file.errorString().toStdString());
    const QByteArray content = file.readAll();
    if (!ParseProjectJson(std::string_view(content.constData(), static_cast<size_t>(content.size())), config, error)) {
        if (error) *error = path + ": " + *error;
        return false;
    }
    return true;
}

}  // namespace tarvo
