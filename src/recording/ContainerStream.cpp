#include "recording/ContainerStream.h"

#include "platform/values/PropertyDictionary.h"
#include "recording/ContainerFrames.h"
#include "recording/HidRecorderReader.h"
#include "recording/JsonValue.h"
#include "recording/PropertyValueBuilder.h"

#include <rapidjson/reader.h>

#include <cerrno>
#include <cstdint>
#include <cstring>
#include <vector>
#include <poll.h>
#include <unistd.h>
#include <exception>
#include <optional>
#include <stdexcept>
#include <string>
#include <string_view>
#include <utility>

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

// RapidJSON's input from a file descriptor, read in pieces as the parser
// needs them. Waiting for input (a pipe) is done in poll() with a short
// timeout, so that a stop request is seen even when it came just before a
// read that would block for ever; a stop or a read error ends the input as
// its end would (the caller tells which).
class DescriptorInput {
public:
    using Ch = char;

    DescriptorInput(int fd, const std::function<bool()>& stopRequested)
        : _fd(fd), _stopRequested(stopRequested), _buffer(kReadBufferBytes)
    {
        refill();
    }

    Ch Peek() const { return *_current; }
    Ch Take()
    {
        const Ch c = *_current;
        if (_current < _last) {
            ++_current;
        } else {
            refill();
        }
        return c;
    }
    std::size_t Tell() const { return _consumed + static_cast<std::size_t>(_current - _buffer.data()); }

    // Takes the run of plain string bytes (none of '"', '\\' or a control
    // character) that starts here and lies in what has been read, leaving the
    // last byte read for Take(), which reads on. Nearly all of a container is
    // the text of hex reports: the parser copies each run in one piece
    // instead of byte by byte.
    std::string_view takePlainRun()
    {
        const Ch* const start = _current;
        const Ch* run = start;
        // Eight bytes at a time while none of them ends the run (the usual
        // tests for a zero byte, less than 0x20, and a quote or backslash).
        constexpr std::uint64_t kOnes = 0x0101010101010101u;
        constexpr std::uint64_t kHighs = 0x8080808080808080u;
        const auto hasZero = [](std::uint64_t v) { return ((v - kOnes) & ~v & kHighs) != 0; };
        while (_last - run >= 8) {
            std::uint64_t word = 0;
            std::memcpy(&word, run, sizeof word);
            if (((word - 0x20 * kOnes) & ~word & kHighs) != 0 || hasZero(word ^ ('"' * kOnes)) ||
                hasZero(word ^ ('\\' * kOnes))) {
                break;
            }
            run += 8;
        }
        while (run < _last && static_cast<unsigned char>(*run) >= 0x20 && *run != '"' && *run != '\\') ++run;
        _current += run - start;
        return {start, static_cast<std::size_t>(run - start)};
    }
    // The first bytes, when there are four (a byte order mark is looked for).
    const Ch* Peek4() const { return _current + 4 <= _last ? _current : nullptr; }

    // Everything not taken yet, piece by piece as it is read (a text that is
    // not JSON is read this way, not by the parser).
    template <typename Consume>
    void forEachPiece(Consume consume)
    {
        while (!_ended) {
            consume(std::string_view(_current, static_cast<std::size_t>(_last - _current + 1)));
            refill();
        }
    }

    // Output is never asked of an input stream.
    void Put(Ch) {}
    void Flush() {}
    Ch* PutBegin() { return nullptr; }
    std::size_t PutEnd(Ch*) { return 0; }

private:
    static constexpr int kStopPollMilliseconds = 100;

    void refill()
    {
        if (_ended) return;  // stays on the terminating '\0'
        _consumed += _filled;
        const ssize_t count = readSome();
        _current = _buffer.data();
        if (count <= 0) {
            _buffer[0] = '\0';
            _last = _current;
            _filled = 0;
            _ended = true;
            return;
        }
        _filled = static_cast<std::size_t>(count);
        _last = _current + count - 1;
    }

    ssize_t readSome()
    {
        for (;;) {
            if (_stopRequested && _stopRequested()) return -1;
            pollfd ready{_fd, POLLIN, 0};
            const int polled = ::poll(&ready, 1, kStopPollMilliseconds);
            if (polled == 0 || (polled < 0 && errno == EINTR)) continue;
            const ssize_t count = ::read(_fd, _buffer.data(), _buffer.size());
            if (count < 0 && errno == EINTR) continue;
            return count;
        }
    }

    int _fd;
    const std::function<bool()>& _stopRequested;
    std::vector<Ch> _buffer;
    Ch* _current = nullptr;
    Ch* _last = nullptr;
    std::size_t _filled = 0;
    std::size_t _consumed = 0;
    bool _ended = false;
};

}  // namespace
}  // namespace VeltoTouch

namespace rapidjson {

// The reader's hook for copying a string's plain bytes in bulk, which it
// provides only for text in memory, given for the file input. Only the run
// is copied: escapes, the closing quote and control characters are left to
// the reader, byte by byte, with its own errors.
template <>
template <>
inline void Reader::ScanCopyUnescapedString<VeltoTouch::DescriptorInput, Reader::StackStream<char>>(
    VeltoTouch::DescriptorInput& input, Reader::StackStream<char>& output)
{
    const std::string_view run = input.takePlainRun();
    if (!run.empty()) std::memcpy(output.Push(static_cast<SizeType>(run.size())), run.data(), run.size());
}

}  // namespace rapidjson

namespace VeltoTouch {
namespace {

// Whether text is well-formed UTF-8 (no overlong forms, no surrogates,
// nothing past U+10FFFF), as the whole-text reader requires of strings.
bool isUtf8(const char* text, std::size_t length)
{
    const auto* bytes = reinterpret_cast<const unsigned char*>(text);
    std::size_t i = 0;
    while (i < length) {
        const unsigned char lead = bytes[i];
        if (lead < 0x80) {
            ++i;
            continue;
        }
        std::size_t count = 0;
        unsigned char low = 0x80;
        unsigned char high = 0xBF;
        if (lead >= 0xC2 && lead <= 0xDF) {
            count = 1;
        } else if (lead >= 0xE0 && lead <= 0xEF) {
            count = 2;
            if (lead == 0xE0) low = 0xA0;
            if (lead == 0xED) high = 0x9F;
        } else if (lead >= 0xF0 && lead <= 0xF4) {
            count = 3;
            if (lead == 0xF0) low = 0x90;
            if (lead == 0xF4) high = 0x8F;
        } else {
            return false;
        }
        if (i + count >= length) return false;  // cut short
        if (bytes[i + 1] < low || bytes[i + 1] > high) return false;
        for (std::size_t k = 2; k <= count; ++k) {
            if (bytes[i + k] < 0x80 || bytes[i + k] > 0xBF) return false;
        }
        i += count + 1;
    }
    return true;
}

// A string of the container; RapidJSON is asked not to validate encodings
// (it would check every byte of every report), so only text with bytes past
// ASCII is checked here.
std::string checkedText(const char* text, rapidjson::SizeType length)
{
    // Eight bytes at a time: any of them past ASCII has its top bit set.
    constexpr std::uint64_t kTopBits = 0x8080808080808080u;
    std::uint64_t any = 0;
    rapidjson::SizeType i = 0;
    for (; i + 8 <= length; i += 8) {
        std::uint64_t word;
        std::memcpy(&word, text + i, sizeof word);
        any |= word;
    }
    for (; i < length; ++i) any |= static_cast<unsigned char>(text[i]);
    if ((any & kTopBits) != 0 && !isUtf8(text, length)) rejectContainer("invalid container");
    return std::string(text, length);
}

// The container's structure, followed event by event (RapidJSON's SAX
// interface). Version-1 frame objects are taken apart as they pass: each
// entry that matters is kept as ContainerFrames reads it, the rest counted
// through. Values that matter whole (the version, a state frame's value,
// anything in a version-0 container or where a frame object should be) are
// built with the whole-text reader's builder and judged by the same code.
class StreamHandler {
public:
    explicit StreamHandler(const ContainerStream::FrameHandler& onFrame) : _onFrame(onFrame) {}

    // Why the parse stopped early, if the handler stopped it.
    std::exception_ptr failure() const { return _failure; }
    // The container's version, once read.
    std::uint64_t version() const { return _version.value_or(0); }

    bool Null() { return event([&] { return scalar(PropertyValue::null()); }); }
    bool Bool(bool value) { return event([&] { return scalar(PropertyValue::boolean(value)); }); }
    bool Int(int value) { return Int64(value); }
    bool Uint(unsigned value) { return Uint64(value); }
    // Negative integers only (and "-0"), as the builder expects them.
    bool Int64(std::int64_t value)
    {
        return event([&] {
            return scalar(value < 0 ? PropertyValue::int64(value)
                                    : PropertyValue::uint64(static_cast<std::uint64_t>(value)));
        });
    }
    bool Uint64(std::uint64_t value) { return event([&] { return scalar(PropertyValue::uint64(value)); }); }
    bool Double(double value) { return event([&] { return scalar(PropertyValue::float64(value)); }); }
    bool RawNumber(const char*, rapidjson::SizeType, bool) { return false; }  // not asked for
    bool String(const char* text, rapidjson::SizeType length, bool)
    {
        return event([&] {
            // Checked even where it is skipped: the whole-text reader refuses
            // malformed text anywhere in the document.
            std::string value = checkedText(text, length);
            if (_skipUntilDepth) return true;
            if (_fields && !_capture) {
                ContainerFrames::Field& field = *_field;
                field.present = true;
                field.isText = true;
                field.text = std::move(value);
                field.value = PropertyValue();
                return true;
            }
            return scalar(PropertyValue::string(std::move(value)));
        });
    }
    bool Key(const char* text, rapidjson::SizeType length, bool)
    {
        return event([&] {
            std::string key = checkedText(text, length);
            if (_skipUntilDepth) return true;
            if (_capture) return _capture->key(key);
            if (_fields) {
                _field = &_fields->named(key);
            } else if (_place == Place::Top) {
                _topKey = topKeyOf(key);
            }
            return true;
        });
    }
    bool StartObject() { return event([&] { return open(true); }); }
    bool EndObject(rapidjson::SizeType) { return event([&] { return close(true); }); }
    bool StartArray() { return event([&] { return open(false); }); }
    bool EndArray(rapidjson::SizeType) { return event([&] { return close(false); }); }

private:
    enum class Place { BeforeTop, Top, Frames, Reports, AfterTop };
    enum class TopKey { Version, Frames, Reports, Other };
    enum class Captured { Version, Element, StateValue };

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

    bool scalar(PropertyValue value)
    {
        if (_skipUntilDepth) return true;
        if (_capture) {
            if (!_capture->scalar(std::move(value))) rejectContainer("invalid container");
            if (_depth == _captureDepth) finishCapture();
            return true;
        }
        if (_fields) {
            *_field = ContainerFrames::Field::of(std::move(value));
            return true;
        }
        switch (_place) {
        case Place::BeforeTop: rejectContainer("invalid container");
        case Place::Top: return topValue(std::move(value));
        case Place::Frames:
        case Place::Reports:
            beginCapture(Captured::Element, _depth);
            if (!_capture->scalar(std::move(value))) rejectContainer("invalid container");
            finishCapture();
            return true;
        case Place::AfterTop: return true;
        }
        return true;
    }

    bool open(bool isObject)
    {
        if (_depth >= PropertyValueBuilder::kMaxNestingDepth) rejectContainer("invalid container");
        const std::size_t outside = _depth++;
        if (_skipUntilDepth) return true;
        if (_capture) return isObject ? _capture->start_object() : _capture->start_array();
        if (_fields) {
            // The value of an entry of a frame object.
            if (_field == &_fields->value) {
                beginCapture(Captured::StateValue, outside);
                return isObject ? _capture->start_object() : _capture->start_array();
            }
            if (_field != &_fields->other) {
                // Neither text nor a number: what the checks need to know of it.
                *_field = ContainerFrames::Field::of(PropertyValue::null());
            }
            _skipUntilDepth = outside;
            return true;
        }
        switch (_place) {
        case Place::BeforeTop:
            if (!isObject) rejectContainer("invalid container");
            _place = Place::Top;
            return true;
        case Place::Top: return topContainer(isObject, outside);
        case Place::Frames:
            if (isObject) {
                _fields.emplace();
                _field = &_fields->other;
                _frameDepth = _depth;
                return true;
            }
            [[fallthrough]];
        case Place::Reports:
            beginCapture(Captured::Element, outside);
            return isObject ? _capture->start_object() : _capture->start_array();
        case Place::AfterTop: return true;
        }
        return true;
    }

    bool close(bool isObject)
    {
        --_depth;
        if (_skipUntilDepth) {
            if (_depth == *_skipUntilDepth) _skipUntilDepth.reset();
            return true;
        }
        if (_capture) {
            if (!(isObject ? _capture->end_object() : _capture->end_array())) rejectContainer("invalid container");
            if (_depth == _captureDepth) finishCapture();
            return true;
        }
        if (_fields) {
            // The frame object ends.
            ContainerFrames::Fields fields = std::move(*_fields);
            _fields.reset();
            _onFrame(ContainerFrames::read(std::move(fields)));
            return true;
        }
        switch (_place) {
        case Place::Frames:
        case Place::Reports:
            _place = Place::Top;
            _framesSeen = true;
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

    // A scalar value of a key of the container itself.
    bool topValue(PropertyValue value)
    {
        const TopKey key = std::exchange(_topKey, TopKey::Other);
        if (key == TopKey::Version) {
            if (_framesSeen) rejectContainer("invalid container");
            beginCapture(Captured::Version, _depth);
            if (!_capture->scalar(std::move(value))) rejectContainer("invalid container");
            finishCapture();
            return true;
        }
        if (wantedFrames(key)) {
            if (key == TopKey::Frames) throw std::invalid_argument("invalid frames");
            rejectContainer("invalid reports");
        }
        return true;
    }

    // An object or array as the value of a key of the container itself.
    bool topContainer(bool isObject, std::size_t outside)
    {
        const TopKey key = std::exchange(_topKey, TopKey::Other);
        if (key == TopKey::Version) {
            if (_framesSeen) rejectContainer("invalid container");
            beginCapture(Captured::Version, outside);
            return isObject ? _capture->start_object() : _capture->start_array();
        }
        if (wantedFrames(key)) {
            if (isObject) {
                if (key == TopKey::Frames) throw std::invalid_argument("invalid frames");
                rejectContainer("invalid reports");
            }
            _place = key == TopKey::Frames ? Place::Frames : Place::Reports;
            return true;
        }
        _skipUntilDepth = outside;
        return true;
    }

    // Whether `key` holds the frames of this container's version.
    bool wantedFrames(TopKey key)
    {
        if (key != TopKey::Frames && key != TopKey::Reports) return false;
        if (!_version) throw FramesBeforeVersion{};
        if ((key == TopKey::Frames) != (*_version == 1)) return false;  // the other version's: dropped
        if (_framesSeen) rejectContainer("invalid container");
        return true;
    }

    void beginCapture(Captured what, std::size_t outside)
    {
        _capture.emplace(/*scalarTopLevelAllowed=*/true);
        _captured = what;
        _captureDepth = outside;
    }

    void finishCapture()
    {
        PropertyValue value = _capture->takeResult();
        _capture.reset();
        switch (_captured) {
        case Captured::Version: {
            if (!value.isNumberOrBoolean()) rejectContainer("invalid version");
            const std::uint64_t version = value.toUInt64();
            if (version > 1) rejectContainer("invalid container version: " + std::to_string(version));
            _version = version;
            return;
        }
        case Captured::StateValue:
            _fields->value = ContainerFrames::Field::of(std::move(value));
            return;
        case Captured::Element:
            if (_place == Place::Reports) {
                try {
                    value = ContainerFrames::fromVersion0(value);
                } catch (const std::invalid_argument& error) {
                    rejectContainer(error.what());
                }
            }
            _onFrame(ContainerFrames::read(value));
            return;
        }
    }

    const ContainerStream::FrameHandler& _onFrame;
    std::exception_ptr _failure;

    Place _place = Place::BeforeTop;
    std::size_t _depth = 0;  // containers open
    TopKey _topKey = TopKey::Other;
    std::optional<std::uint64_t> _version;
    bool _framesSeen = false;
    // Inside a value that is only counted through, until _depth is back here.
    std::optional<std::size_t> _skipUntilDepth;

    // The version-1 frame object being read, and the entry whose value comes next.
    std::optional<ContainerFrames::Fields> _fields;
    ContainerFrames::Field* _field = nullptr;
    std::size_t _frameDepth = 0;

    std::optional<PropertyValueBuilder> _capture;
    Captured _captured = Captured::Element;
    std::size_t _captureDepth = 0;  // _depth outside the value being built
};

}  // namespace

std::string ContainerStream::Format::text() const
{
    return hidRecorder ? "hid-recorder text" : "container version " + std::to_string(version);
}

ContainerStream::Format ContainerStream::read(int fd, const FrameHandler& onFrame,
                                              const std::function<bool()>& stopRequested,
                                              std::optional<std::uint32_t> hidDevice)
{
    const off_t start = ::lseek(fd, 0, SEEK_CUR);
    DescriptorInput input(fd, stopRequested);
    // A byte order mark is skipped, as the whole-text reader skips it.
    if (const char* first = input.Peek4(); first && std::memcmp(first, "\xEF\xBB\xBF", 3) == 0) {
        for (int i = 0; i < 3; ++i) input.Take();
    }
    // Blank space before the first character means nothing in either format;
    // a hid-recorder text's line numbers count its line breaks, though.
    std::uint64_t lineBreaks = 0;
    while (input.Peek() == ' ' || input.Peek() == '\t' || input.Peek() == '\r' || input.Peek() == '\n') {
        if (input.Take() == '\n') ++lineBreaks;
    }
    if (HidRecorderReader::opensWith(input.Peek())) {
        HidRecorderReader reader(onFrame, hidDevice);
        for (; lineBreaks > 0; --lineBreaks) reader.feed("\n");
        input.forEachPiece([&](std::string_view piece) { reader.feed(piece); });
        // Cut short by the stop: the last line may be a part of one.
        if (stopRequested && stopRequested()) throw std::runtime_error("the read was stopped");
        reader.finish();
        return {.hidRecorder = true};
    }
    StreamHandler handler(onFrame);
    rapidjson::Reader reader;
    constexpr unsigned kFlags = rapidjson::kParseFullPrecisionFlag | rapidjson::kParseIterativeFlag;

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
    if (!framesBeforeVersion) return {.version = handler.version()};

    // Read whole, from the start, when the file can be read again.
    if (start < 0 || ::lseek(fd, start, SEEK_SET) != start) {
        throw std::runtime_error("the container gives its frames before its \"Version\", and this input cannot "
                                 "be read again to take them in that order");
    }
    std::string text;
    std::vector<char> buffer(kReadBufferBytes);
    for (;;) {
        const ssize_t count = ::read(fd, buffer.data(), buffer.size());
        if (count < 0 && errno == EINTR) continue;
        if (count <= 0) break;
        text.append(buffer.data(), static_cast<std::size_t>(count));
    }
    PipelineRecording recording{std::string_view(text)};
    // Read whole, the container was valid: its version is a number.
    const std::uint64_t version = JsonValue::parse(text).asDictionary().get(ContainerFrames::kVersionKey).toUInt64();
    text.clear();
    text.shrink_to_fit();
    for (const Frame& frame : recording.frames()) {
        Frame copy = frame;
        onFrame(std::move(copy));
    }
    return {.version = version};
}

}  // namespace VeltoTouch
