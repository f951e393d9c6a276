// tekoj-encode: encodes an image file (PNG, PPM or PGM) to JPEG with
// libTekoJEncoder, or, without arguments, a built-in sample image.
//
//   tekoj-encode                                   writes tekoj-sample.jpg
//   tekoj-encode [-q quality] [--grey] input output.jpg
#include <TekoJEncoder.h>

#ifdef TEKOJ_HAVE_PNG
#include <png.h>
#endif

#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

namespace {

struct Picture {
    int width = 0, height = 0;
    uint32_t format = EKO_FORMAT_RGB888;
    std::vector<uint8_t> pixels;
};

// A 1024x768 scene: sky gradient, a sun, rolling hills and a textured field,
// so that the sample exercises smooth areas, edges and detail alike.
Picture sample_picture() {
    Picture p;
    p.width = 1024;
    p.height = 768;
    p.pixels.resize(static_cast<size_t>(p.width) * p.height * 3);
    for (int y = 0; y < p.height; ++y) {
        for (int x = 0; x < p.width; ++x) {
            const double fx = x / 1023.0, fy = y / 767.0;
            double r = 90 + 80 * fy, g = 150 + 60 * fy, b = 235 - 40 * fy;
            const double dx = x - 760.0, dy = y - 170.0;
            if (dx * dx + dy * dy < 70.0 * 70.0) r = 255, g = 220, b = 120;
            const double hill = 430 + 60 * std::sin(fx * 7.0) + 25 * std::sin(fx * 23.0 + 1.0);
            if (y > hill) {
                const double tex = 18 * std::sin(x * 0.9 + y * 0.35) * std::sin(y * 0.7);
                r = 60 + 40 * fx + tex;
                g = 140 - 50 * (fy - 0.55) + tex;
                b = 50 + tex / 2;
            }
            uint8_t* px = &p.pixels[(static_cast<size_t>(y) * p.width + x) * 3];
            px[0] = static_cast<uint8_t>(std::fmin(255, std::fmax(0, r)));
            px[1] = static_cast<uint8_t>(std::fmin(255, std::fmax(0, g)));
            px[2] = static_cast<uint8_t>(std::fmin(255, std::fmax(0, b)));
        }
    }
    return p;
}

bool read_pnm(const char* path, Picture& p) {
    FILE* f = std::fopen(path, "rb");
    if (f == nullptr) return false;
    char magic[3] = {};
    int maxval = 0;
    bool ok = std::fscanf(f, "%2s %d %d %d", magic, &p.width, &p.height, &maxval) == 4 && maxval == 255 &&
              p.width > 0 && p.height > 0 && (std::strcmp(magic, "P6") == 0 || std::strcmp(magic, "P5") == 0);
    if (ok) {
        std::fgetc(f);
        const bool grey = magic[1] == '5';
        p.format = grey ? EKO_FORMAT_GREY : EKO_FORMAT_RGB888;
        p.pixels.resize(static_cast<size_t>(p.width) * p.height * (grey ? 1 : 3));
        ok = std::fread(p.pixels.data(), 1, p.pixels.size(), f) == p.pixels.size();
    }
    std::fclose(f);
    return ok;
}

#ifdef TEKOJ_HAVE_PNG
bool read_png(const char* path, Picture& p) {
    png_image image{};
    image.version = PNG_IMAGE_VERSION;
    if (!png_image_begin_read_from_file(&image, path)) return false;
    image.format = PNG_FORMAT_RGB;
    p.width = static_cast<int>(image.width);
    p.height = static_cast<int>(image.height);
    p.format = EKO_FORMAT_RGB888;
    p.pixels.resize(PNG_IMAGE_SIZE(image));
    const bool ok = png_image_finish_read(&image, nullptr, p.pixels.data(), 0, nullptr) != 0;
    png_image_free(&image);
    return ok;
}
#endif

bool read_picture(const char* path, Picture& p) {
    const size_t n = std::strlen(path);
    if (n > 4 && std::strcmp(path + n - 4, ".png") == 0) {
#ifdef TEKOJ_HAVE_PNG
        return read_png(path, p);
#else
        std::fprintf(stderr, "built without PNG support\n");
        return false;
#endif
    }
    return read_pnm(path, p);
}

void to_grey(Picture& p) {
    if (p.format == EKO_FORMAT_GREY) return;
    std::vector<uint8_t> grey(static_cast<size_t>(p.width) * p.height);
    for (size_t i = 0; i < grey.size(); ++i)
        grey[i] = static_cast<uint8_t>((77 * p.pixels[3 * i] + 150 * p.pixels[3 * i + 1] + 29 * p.pixels[3 * i + 2]) >> 8);
    p.pixels.swap(grey);
    p.format = EKO_FORMAT_GREY;
}

int usage() {
    std::fprintf(stderr, "usage: tekoj-encode [-q quality] [--grey] input.(png|ppm|pgm) output.jpg\n"
                         "       tekoj-encode            (encodes a built-in sample to tekoj-sample.jpg)\n");
    return 2;
}

}  // namespace

int main(int argc, char** argv) {
    uint32_t quality = 85;
    bool grey = false;
    std::vector<const char*> files;
    for (int i = 1; i < argc; ++i) {
        if (std::strcmp(argv[i], "-q") == 0 && i + 1 < argc) {
            quality = static_cast<uint32_t>(std::atoi(argv[++i]));
        } else if (std::strcmp(argv[i], "--grey") == 0) {
            grey = true;
        } else if (argv[i][0] == '-') {
            return usage();
        } else {
            files.push_back(argv[i]);
        }
    }
    if (files.size() != 0 && files.size() != 2) return usage();

    Picture picture;
    std::string input = "built-in sample";
    std::string output = "tekoj-sample.jpg";
    if (files.empty()) {
        picture = sample_picture();
    } else {
        input = files[0];
        output = files[1];
        if (!read_picture(files[0], picture)) {
            std::fprintf(stderr, "cannot read %s\n", files[0]);
            return 1;
        }
    }
    if (grey) to_grey(picture);

    ImageInfo info{};
    info.width = picture.width;
    info.height = picture.height;
    info.data = picture.pixels.data();
    info.format = picture.format;
    if (eko_enc_jpeg_to_file(&info, output.c_str(), quality) != 1) {
        std::fprintf(stderr, "encoding %s failed (error %u)\n", input.c_str(), eko_GetLastError());
        return 1;
    }
    FILE* f = std::fopen(output.c_str(), "rb");
    long size = -1;
    if (f != nullptr) {
        std::fseek(f, 0, SEEK_END);
        size = std::ftell(f);
        std::fclose(f);
    }
    std::printf("wrote %s: %dx%d %s JPEG at quality %u, %ld bytes (from %s)\n", output.c_str(), picture.width,
                picture.height, picture.format == EKO_FORMAT_GREY ? "greyscale" : "colour 4:2:0", quality, size,
                input.c_str());
    return 0;
}
