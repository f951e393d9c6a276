// An outside C++17 program found through find_package: encodes a small
// RGB image with the C++ interface into the file named on the command line.
#include <TekoJEncoder.hpp>

#include <cstdio>
#include <vector>

int main(int argc, char** argv) {
    if (argc != 2) return 2;
    std::vector<uint8_t> rgb(40 * 30 * 3);
    for (size_t i = 0; i < rgb.size(); ++i) rgb[i] = static_cast<uint8_t>(i * 13);
    try {
        tekoj::Encoder encoder;
        encoder.quality(85);
        encoder.encode_to_file(tekoj::ImageView(rgb.data(), 40, 30, tekoj::PixelFormat::rgb888), argv[1]);
    } catch (const tekoj::Error& e) {
        std::fprintf(stderr, "%s\n", e.what());
        return 1;
    }
    return eko_GetVersion() == TEKOJ_VERSION ? 0 : 1;
}
