#include "fuzz/Check.h"
#include "tavrind/decoder.h"
#include "tavrind/encoder.h"

/// Coded bytes: the bitmap's length, whether it is compressed, and what `rle_compress` makes of it. What expands can be
/// coded again, and expands to the same. The input is a bitmap and a signature's text too.
void runInput(std::string_view input)
{
    (void)tavrin::readSignature(input);

    const std::string_view bitmap = input.substr(0, 0xffff);
    const auto coding = tavrin::rle_compress(bitmap);
    check(coding.bytes.size() <= bitmap.size() + 4);
    check(tavrin::rle_expand(coding.bytes, 4, coding.bytes.size() - 4, bitmap.size(), coding.compressed) == bitmap);
    const auto signature = tavrin::makeSignature(static_cast<std::uint16_t>(bitmap.size()), coding, "0a1b2c");
    check(signature && tavrin::readSignature(*signature).value().bitmap == bitmap);

    if (input.size() < 4) return;
    const auto byte = [&](std::size_t at) { return static_cast<unsigned char>(input[at]); };
    const std::size_t length = byte(0) | byte(1) << 8;
    const std::size_t offset = byte(2);
    const std::string_view buffer = input.substr(4);
    const auto expanded =
        tavrin::rle_expand(buffer, offset, buffer.size() - std::min(buffer.size(), offset), length, byte(3) & 1);
    check(!expanded || expanded->size() == length);
}
