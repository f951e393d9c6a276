// An outside C++17 program found through find_package: encodes a small
// RGB image into the file named on the command line.
#include <TekoJEncoder.h>

#include <cstdio>
#include <vector>

int main(int argc, char** argv) {
    if (argc != 2) return 2;
    std::vector<uint8_t> rgb(40 * 30 * 3);
    for (size_t i = 0; i < rgb.size(); ++i) rgb[i] = static_cast<uint8_t>(i * 13);
    ImageInfo info{};
    info.width = 40;
    info.height = 30;
    info.data = rgb.data();
    info.format = EKO_FORMAT_RGB888;
    if (eko_enc_jpeg_to_file(&info, argv[1], 85) != 1) {
        std::fprintf(stderr, "encode failed (error %u)\n", static_cast<unsigned>(eko_GetLastError()));
        return 1;
    }
    return eko_GetVersion() == TEKOJ_VERSION ? 0 : 1;
}
