#include "recording/ContainerStream.h"

#include "recording/ContainerFrames.h"
#include "recording/PropertyValueBuilder.h"

#include <rapidjson/filereadstream.h>
#include <rapidjson/reader.h>

#include <cstring>
#include <exception>
#include <optional>
#include <stdexcept>
#include <string>
#include <string_view>

namespace VeltoTouch {

namespace {

using Frame = PipelineRecording::Frame;

constexpr std::string_view kMigrationFailed = "migrateSerializedContainer failed: ";
constexpr std::size_t kReadBufferBytes = 1 << 16;

[[noreturn]] void rejectContainer(const std::string& message)
{
    throw std::runtime_error(std::string(kMigrationFailed) + message);
}

// Raised when the frames come before the version: the file must be read whole.
struct FramesBeforeVersion {};

// The container's structure, followed event by event (RapidJSON's SAX
// interface). Values that matter whole (the version, each frame object) are
// built with the same builder as the whole-text reader's and judged by the
// same code; everything else is only counted through.
class StreamHandler {
public:
    explicit StreamHandler(const ContainerStream::FrameHandler& onFrame) : _onFrame(onFrame) {}

    // Why the parse stopped early, if the handler stopped it.
    std::exception_ptr failure() const { return _failure; }

    bool Null() { return event([&] { return scalar([](PropertyValueBuilder& b) { return b.null(); }); }); }
    bool Bool(bool value)
    {
        return event([&] { return scalar([&](PropertyValueBuilder& b) { return b.boolean(value); }); });
    }
    bool Int(int value) { return Int64(value); }
    bool Uint(unsigned value) { return Uint64(value); }
    bool Int64(std::int64_t value)
    {
        return event([&] { return scalar([&](PropertyValueBuilder& b) { return b.number_integer(value); }); });
    }
    bool Uint64(std::uint64_t value)
    {
        return event([&] { return scalar([&](PropertyValueBuilder& b) { return b.number_unsigned(value); }); });
    }
    bool Double(double value)
    {
        static const std::string kNoText;
        return event([&] { return scalar([&](PropertyValueBuilder& b) { return b.number_float(value, kNoText); }); });
    }
    bool RawNumber(const char*, rapidjson::SizeType, bool) { return false; }  // not asked for
    bool String(const char* text, rapidjson::SizeType length, bool)
    {
        return event([&] {
            return scalar([&](PropertyValueBuilder& b) {
                std::string value(text, length);
                return b.string(value);
            });
        });
    }
    bool Key(const char* text, rapidjson::SizeType length, bool)
    {
        return event([&] {
            if (_capture) {
                std::string key(text, length);
                return _capture->key(key);
            }
            if (_place == Place::Top && _depth == 1) _topKey = topKeyOf(std::string_view(text, length));
            return true;
        });
    }
    bool StartObject() { return event([&] { return open(true); }); }
    bool EndObject(rapidjson::SizeType) { return event([&] { return close(true); }); }
    bool StartArray() { return event([&] { return open(false); }); }
    bool EndArray(rapidjson::SizeType) { return event([&] { return close(false); }); }

private:
    enum class Place { BeforeTop, Top, Frames, Reports, Skipping, AfterTop };
    enum class TopKey { Version, Frames, Reports, Other };
    enum class Captured { Version, Frame };

    static TopKey topKeyOf(std::string_view key)
    {
        if (key == ContainerFrames::kVersionKey) return TopKey::Version;
        if (key == ContainerFrames::kFramesKey) return TopKey::Frames;
        if (key == ContainerFrames::kReportsKey) return TopKey::Reports;
        return TopKey::Other;
    }

    template <typename Step>
    bool event(Step step)
    {
        try {
            return step();
        } catch (...) {
            _failure = std::current_exception();
            return false;
        }
    }

    // A scalar value: into the value being built, or judged where it stands.
    template <typename Add>
    bool scalar(Add add)
    {
        if (_capture) {
            if (!add(*_capture)) rejectContainer("invalid container");
            if (_depth == _captureDepth) finishCapture();
            return true;
        }
        switch (_place) {
        case Place::BeforeTop: rejectContainer("invalid container");
        case Place::Top: return topValue(false, [&](PropertyValueBuilder& b) { return add(b); });
        case Place::Frames:
        case Place::Reports:
            beginCapture(Captured::Frame);
            add(*_capture);
            finishCapture();
            return true;
        case Place::Skipping:
        case Place::AfterTop: return true;
        }
        return true;
    }

    bool open(bool isObject)
    {
        if (_depth >= PropertyValueBuilder::kMaxNestingDepth) rejectContainer("invalid container");
        ++_depth;
        if (_capture) return isObject ? _capture->start_object() : _capture->start_array();
        switch (_place) {
        case Place::BeforeTop:
            if (!isObject) rejectContainer("invalid container");
            _place = Place::Top;
            return true;
        case Place::Top: {
            --_depth;  // topValue counts the level again where it keeps it
            return topValue(true, [&](PropertyValueBuilder& b) {
                return isObject ? b.start_object() : b.start_array();
            }, isObject);
        }
        case Place::Frames:
        case Place::Reports:
            beginCapture(Captured::Frame, _depth - 1);
            return isObject ? _capture->start_object() : _capture->start_array();
        case Place::Skipping:
        case Place::AfterTop: return true;
        }
        return true;
    }

    bool close(bool isObject)
    {
        --_depth;
        if (_capture) {
            if (!(isObject ? _capture->end_object() : _capture->end_array())) rejectContainer("invalid container");
            if (_depth == _captureDepth) finishCapture();
            return true;
        }
        switch (_place) {
        case Place::Frames:
        case Place::Reports:
            _place = Place::Top;
            _framesSeen = true;
            return true;
        case Place::Skipping:
            if (_depth == 1) _place = Place::Top;
            return true;
        case Place::Top:
            // The end of the container: what was never given is missing.
            _place = Place::AfterTop;
            if (!_version) rejectContainer("invalid version");
            if (*_version == 1 && !_framesSeen) throw std::invalid_argument("invalid frames");
            return true;
        case Place::BeforeTop:
        case Place::AfterTop: return true;
        }
        return true;
    }

    // The value of a key of the container itself; `opens` when it begins
    // with '{' or '['.
    template <typename Add>
    bool topValue(bool opens, Add add, bool isObject = false)
    {
        const TopKey key = _topKey;
        _topKey = TopKey::Other;
        if (opens) ++_depth;
        if (key == TopKey::Version) {
            if (_framesSeen) rejectContainer("invalid container");
            beginCapture(Captured::Version, opens ? _depth - 1 : _depth);
            if (!add(*_capture)) rejectContainer("invalid container");
            if (!opens) finishCapture();
            return true;
        }
        const bool frames = key == TopKey::Frames;
        if (frames || key == TopKey::Reports) {
            if (!_version) throw FramesBeforeVersion{};
            const bool wanted = frames == (*_version == 1);
            if (wanted) {
                if (_framesSeen) rejectContainer("invalid container");
                if (!opens || isObject) {
                    if (frames) throw std::invalid_argument("invalid frames");
                    rejectContainer("invalid reports");
                }
                _place = frames ? Place::Frames : Place::Reports;
                return true;
            }
        }
        if (opens) _place = Place::Skipping;
        return true;
    }

    void beginCapture(Captured what) { beginCapture(what, _depth); }
    void beginCapture(Captured what, std::size_t depth)
    {
        _capture.emplace(/*scalarTopLevelAllowed=*/true);
        _captured = what;
        _captureDepth = depth;
    }

    void finishCapture()
    {
        PropertyValue value = _capture->takeResult();
        _capture.reset();
        if (_captured == Captured::Version) {
            if (!value.isNumberOrBoolean()) rejectContainer("invalid version");
            const std::uint64_t version = value.toUInt64();
            if (version > 1) rejectContainer("invalid container version: " + std::to_string(version));
            _version = version;
            return;
        }
        if (_place == Place::Reports) {
            try {
                value = ContainerFrames::fromVersion0(value);
            } catch (const std::invalid_argument& error) {
                rejectContainer(error.what());
            }
        }
        _onFrame(ContainerFrames::read(value));
    }

    const ContainerStream::FrameHandler& _onFrame;
    std::exception_ptr _failure;

    Place _place = Place::BeforeTop;
    std::size_t _depth = 0;  // containers open
    TopKey _topKey = TopKey::Other;
    std::optional<std::uint64_t> _version;
    bool _framesSeen = false;

    std::optional<PropertyValueBuilder> _capture;
    Captured _captured = Captured::Frame;
    std::size_t _captureDepth = 0;  // _depth where the captured value ends
};

}  // namespace

void ContainerStream::read(std::FILE* file, const FrameHandler& onFrame)
{
    const long start = std::ftell(file);
    char buffer[kReadBufferBytes];
    rapidjson::FileReadStream input(file, buffer, sizeof buffer);
    // A byte order mark is skipped, as the whole-text reader skips it.
    if (const char* first = input.Peek4(); first && std::memcmp(first, "\xEF\xBB\xBF", 3) == 0) {
        for (int i = 0; i < 3; ++i) input.Take();
    }
    StreamHandler handler(onFrame);
    rapidjson::Reader reader;
    constexpr unsigned kFlags =
        rapidjson::kParseValidateEncodingFlag | rapidjson::kParseFullPrecisionFlag | rapidjson::kParseIterativeFlag;

    bool framesBeforeVersion = false;
    if (!reader.Parse<kFlags>(input, handler)) {
        if (const std::exception_ptr failure = handler.failure()) {
            try {
                std::rethrow_exception(failure);
            } catch (const FramesBeforeVersion&) {
                framesBeforeVersion = true;
            }
        } else {
            rejectContainer("invalid container");
        }
    }
    if (!framesBeforeVersion) return;

    // Read whole, from the start, when the file can be read again.
    if (start < 0 || std::fseek(file, start, SEEK_SET) != 0) {
        throw std::runtime_error("the container gives its frames before its \"Version\", and this input cannot "
                                 "be read again to take them in that order");
    }
    std::string text;
    for (std::size_t count; (count = std::fread(buffer, 1, sizeof buffer, file)) > 0;) text.append(buffer, count);
    PipelineRecording recording{std::string_view(text)};
    text.clear();
    text.shrink_to_fit();
    for (const Frame& frame : recording.frames()) {
        Frame copy = frame;
        onFrame(std::move(copy));
    }
}

}  // namespace VeltoTouch
