// Row-parallel encoding: the caller's threads code MCU rows at once, and the
// rows are handed on in image order into exactly the single-threaded stream.
//
// Every MCU row is a restart interval of its own. A row's bytes in the
// single-threaded stream are therefore what a coder produces that starts on
// the row with an empty bit buffer, DC predictors of 0 and the restart clock
// of the row's first MCU (its leading RST marker, for every row but the
// first), and that ends by padding its last byte with 1-bits. Each worker is
// a copy of the encode's context that shares the read-only tables and owns
// what coding changes: sample rows, coefficient blocks, coder state, the
// component records (the last band shortens their row counts) and its
// output, which is switched to the row buffer of the row being coded.
//
// Row buffers form a window: row k uses buffer k mod W, free once row k - W
// has been handed on. Whoever completes the first row not yet handed on
// hands it and every completed row after it on; the rest leave their rows
// behind for that worker. A file or stream target takes the row buffers as
// they are; a memory target gets each row appended once.
#include "api/context.h"
#include "core/band_driver.h"
#include "core/entropy_coder.h"
#include "core/header_writer.h"
#include "input/readers.h"
#include "sink/output_target.h"

#include <algorithm>
#include <condition_variable>
#include <mutex>
#include <new>

namespace tekoj {
namespace {

constexpr uint32_t kMaxWorkers = 64;
// Row buffer capacity a window aims to stay within (at least two buffers
// per worker whatever the width).
constexpr uint64_t kWindowCapacity = 4u << 20;

struct RowBuffer {
    OutputTarget target;  // kind memory: the coded row
    uint32_t row;         // row held or being coded
    bool busy;            // claimed by a worker, not yet handed on
    bool done;            // coded, waiting to be handed on
};

struct Worker {
    EncoderContext* ctx;  // null in serial mode
    bool busy;            // a rows call is using this worker
};

}  // namespace
}  // namespace tekoj

struct EkoParallelEncode {
    EncoderContext* main;
    tekoj::ReadOrigin origin;
    uint32_t rows;
    uint32_t workers;
    uint32_t window;
    bool serial;  // rows depend on each other: coded on the main context in order
    tekoj::Worker* worker;
    tekoj::RowBuffer* buffer;

    std::mutex lock;
    std::condition_variable changed;
    uint32_t handed = 0;   // rows handed on (serial: coded) so far
    bool serial_busy = false;
    bool handing = false;  // a worker is handing rows on
    uint32_t failed = 0;   // first error code of any worker or of the output
    uint64_t row_bytes = 0;  // coded bytes handed on so far (by the worker handing on)
};

namespace tekoj {
namespace {

using Encode = EkoParallelEncode;
using Guard = std::unique_lock<std::mutex>;

uint32_t refuse(uint32_t code) {
    eko_SetError(code);
    return 0;
}

void fail_locked(Encode* e, uint32_t code) {
    if (e->failed == 0) e->failed = code != 0 ? code : uint32_t{EKO_ERR_STATE};
    e->changed.notify_all();
}

template <typename T>
T* allocate_zeroed(uint32_t count = 1) {
    auto* p = static_cast<T*>(DORVATEKO_OsMalloc(count * static_cast<uint32_t>(sizeof(T))));
    if (p == nullptr) {
        eko_SetError(EKO_ERR_ALLOC);
        return nullptr;
    }
    DORVATEKO_OsMemset(p, 0, count * static_cast<uint32_t>(sizeof(T)));
    return p;
}

void release_worker(EncoderContext* w) {
    if (w == nullptr) return;
    if (w->sample_rows != nullptr) {
        if (w->comp_info != nullptr) release_band_rows(w);
        DORVATEKO_OsFree(w->sample_rows);
    }
    if (w->mcu_state != nullptr) {
        if (w->mcu_state->mcu_buffer[0] != nullptr) DORVATEKO_OsFree(w->mcu_state->mcu_buffer[0]);
        DORVATEKO_OsFree(w->mcu_state);
    }
    if (w->entropy != nullptr) DORVATEKO_OsFree(w->entropy);
    if (w->comp_info != nullptr) DORVATEKO_OsFree(w->comp_info);
    DORVATEKO_OsFree(w);
}

// A worker: the main context's description and tables, its own copies of
// everything that coding a band writes.
EncoderContext* make_worker(const EncoderContext* main) {
    auto* w = static_cast<EncoderContext*>(DORVATEKO_OsMalloc(sizeof(EncoderContext)));
    if (w == nullptr) {
        eko_SetError(EKO_ERR_ALLOC);
        return nullptr;
    }
    DORVATEKO_OsMemcpy(w, main, sizeof(EncoderContext));
    w->comp_info = nullptr;
    w->sample_rows = nullptr;
    w->mcu_state = nullptr;
    w->entropy = nullptr;
    w->output = nullptr;  // the row buffer of the row being coded
    w->work_buffer = nullptr;
    w->exif_info = nullptr;
    w->columns = nullptr;
    w->saved_output = nullptr;
    w->failed = 0;

    const uint32_t n = main->num_components;
    bool ok = (w->comp_info = allocate_zeroed<ComponentInfo>(n)) != nullptr;
    if (ok) {
        DORVATEKO_OsMemcpy(w->comp_info, main->comp_info, n * static_cast<uint32_t>(sizeof(ComponentInfo)));
        for (uint32_t c = 0; c < n && c < 3; ++c) w->cur_comp_info[c] = &w->comp_info[c];
        ok = (w->sample_rows = allocate_zeroed<SampleRowSet>()) != nullptr && allocate_band_rows(w);
    }
    ok = ok && (w->mcu_state = allocate_zeroed<McuState>()) != nullptr;
    int16_t* blocks = ok ? allocate_zeroed<int16_t>(10 * 64) : nullptr;
    if (blocks != nullptr)
        for (int k = 0; k < 10; ++k) w->mcu_state->mcu_buffer[k] = blocks + 64 * k;
    ok = blocks != nullptr && (w->entropy = allocate_zeroed<EntropyState>()) != nullptr;
    if (ok) *w->entropy = *main->entropy;  // the code tables are shared, read-only
    if (!ok) {
        release_worker(w);
        return nullptr;
    }
    return w;
}

void release_encode(Encode* e) {
    if (e->worker != nullptr) {
        for (uint32_t i = 0; i < e->workers; ++i) release_worker(e->worker[i].ctx);
        DORVATEKO_OsFree(e->worker);
    }
    if (e->buffer != nullptr) {
        for (uint32_t i = 0; i < e->window; ++i)
            if (e->buffer[i].target.buffer != nullptr) DORVATEKO_OsFree(e->buffer[i].target.buffer);
        DORVATEKO_OsFree(e->buffer);
    }
    e->~Encode();
    DORVATEKO_OsFree(e);
}

// MCU rows in every band but the last: a single-component scan codes one
// MCU per block, so its bands hold v block rows.
uint32_t mcu_rows_per_band(const EncoderContext* ctx) {
    return ctx->comps_in_scan > 1 ? 1 : ctx->cur_comp_info[0]->v_samp_factor;
}

// Coding rows apart needs every band to start a restart interval.
bool rows_independent(const EncoderContext* ctx) {
    const uint32_t interval = ctx->restart_interval;
    const uint32_t mcus_per_band = ctx->mcus_per_row * mcu_rows_per_band(ctx);
    return interval != 0 && mcus_per_band % interval == 0;
}

// Allocates the workers and the window of row buffers (false after reporting
// error 3).
bool prepare(Encode* e) {
    const EncoderContext* main = e->main;
    // Serial mode codes on the main context; its workers only take turns.
    if (e->serial) return (e->worker = allocate_zeroed<Worker>(e->workers)) != nullptr;
    // A deep window of row buffers pays twice. A buffer comes round again
    // only after many rows, by when the lines that one core wrote and the
    // hand-on read have left the other core's cache: with 2 buffers per
    // worker rows were coded a fifth slower, fetching their output lines
    // from the other core. And a worker runs on past a row that another
    // is still coding, a slow one or one whose thread lost its core for a
    // time slice (on a loaded device worth dozens of rows). Up to 16 rows
    // per worker, within kWindowCapacity of row buffers in all (their
    // capacity is a pessimistic guess; a row touches a fraction).
    const uint64_t row_guess = uint64_t{main->mcus_per_row} * main->blocks_in_mcu * 48u + 64u;
    const uint64_t fit = kWindowCapacity / (row_guess * e->workers);
    const uint32_t depth = static_cast<uint32_t>(std::clamp<uint64_t>(fit, 2, 16));
    e->window = e->workers * depth < e->rows ? e->workers * depth : e->rows;
    if ((e->worker = allocate_zeroed<Worker>(e->workers)) == nullptr) return false;
    if ((e->buffer = allocate_zeroed<RowBuffer>(e->window)) == nullptr) return false;
    for (uint32_t i = 0; i < e->workers; ++i)
        if ((e->worker[i].ctx = make_worker(main)) == nullptr) return false;
    const uint32_t capacity = static_cast<uint32_t>(std::max<uint64_t>(row_guess, 4096));
    for (uint32_t i = 0; i < e->window; ++i) {
        OutputTarget& t = e->buffer[i].target;
        t.kind = EKO_OUTPUT_MEMORY;
        if ((t.buffer = static_cast<uint8_t*>(DORVATEKO_OsMalloc(capacity))) == nullptr) {
            eko_SetError(EKO_ERR_ALLOC);
            return false;
        }
        t.capacity = capacity;
    }
    return true;
}

// Codes band `row` on worker context `w` into `out`, from a fresh coder
// state and the restart clock of the band's first MCU, and pads its last
// byte with 1-bits as the single-threaded coder does before the next marker
// or the end of the image.
bool code_row(const Encode* e, EncoderContext* w, OutputTarget* out, uint32_t row) {
    w->output = out;
    out->used = 0;
    out->total = 0;
    seek_band(w, e->origin, row);
    McuState* st = w->mcu_state;
    st->imcu_row = row;
    for (uint32_t c = 0; c < w->comps_in_scan; ++c) w->comp_info[c].rows_this_band = w->comp_info[c].band_rows;
    setup_band(w);
    w->entropy->put_buffer = 0;
    w->entropy->put_bits = 0;
    for (int c = 0; c < 3; ++c) w->entropy->last_dc_val[c] = 0;
    if (row == 0) {
        w->restart_mcu_count = -1;
        w->restart_index = 0;
    } else {
        // n intervals precede the band; its first MCU gets marker n - 1.
        const uint64_t mcus_before = static_cast<uint64_t>(row) * w->mcus_per_row * mcu_rows_per_band(w);
        const uint64_t n = mcus_before / w->restart_interval;
        w->restart_mcu_count = 0;
        w->restart_index = static_cast<uint32_t>((n - 1) & 7);
    }
    if (!process_band(w) || !make_room(w, 16, 16)) return false;
    pad_final_byte(w);
    return w->failed == 0;
}

// Passes coded row `row` to the main target the way its kind passes long
// runs: appended to a memory block, handed to the file in one piece, to the
// callback in pieces of at most 4096 bytes.
//
// A memory block that lacks room grows at once to the stream so far plus
// the rows still to come at the mean size of the rows handed on, and an
// eighth more: a few growths in all rather than one every half again, so
// the join copies hardly a byte twice and the worker handing rows on is
// rarely held up by a long copy while the others wait for the window. The
// growth is at least half again (flat rows first make a poor estimate) and
// at most fourfold, so an early dense row cannot claim a block far beyond
// the stream.
bool hand_on_row(Encode* e, uint32_t row, const OutputTarget& coded) {
    EncoderContext* main = e->main;
    const Sink sink = sink_of(main);
    const SinkKind& kind = kind_of(sink.target);
    OutputTarget* t = sink.target;
    if (t->kind == EKO_OUTPUT_MEMORY && t->capacity - t->used < coded.used) {
        const uint64_t mean = (e->row_bytes + coded.used) / (row + 1);
        const uint64_t later = e->rows - row - 1;
        const uint64_t ahead = later * mean + (later * mean + 64) / 8;
        const uint64_t now = static_cast<uint64_t>(t->used) + coded.used;
        const uint64_t room = coded.used + std::clamp(ahead, now / 2, 3 * now);
        if (!kind.reserve(sink, std::min<uint64_t>(room, kMaxMemoryStream - t->used))) return false;
    }
    e->row_bytes += coded.used;
    return kind.write_run(sink, coded.buffer, coded.used) && main->failed == 0;
}

// Serial mode: the rows are one restart interval (or none), so each is coded
// on the main context right after the one before it.
bool serial_row(Encode* e, Guard& g, uint32_t row) {
    e->changed.wait(g, [&] { return e->failed != 0 || row < e->handed || (row == e->handed && !e->serial_busy); });
    if (e->failed != 0) return false;
    if (row < e->handed) {
        fail_locked(e, EKO_ERR_STATE);
        return false;
    }
    e->serial_busy = true;
    g.unlock();
    EncoderContext* main = e->main;
    const bool ok = process_band(main);
    main->next_row = static_cast<uint16_t>(main->next_row + main->max_v_samp * 8u);
    g.lock();
    e->serial_busy = false;
    ++e->handed;
    if (!ok) fail_locked(e, main->failed);
    e->changed.notify_all();
    return ok;
}

bool parallel_row(Encode* e, Guard& g, EncoderContext* w, uint32_t row) {
    RowBuffer& b = e->buffer[row % e->window];
    e->changed.wait(g, [&] { return e->failed != 0 || row < e->handed + e->window; });
    if (e->failed != 0) return false;
    if (row < e->handed || b.busy) {  // coded before, or being coded
        fail_locked(e, EKO_ERR_STATE);
        return false;
    }
    b.busy = true;
    b.done = false;
    b.row = row;
    g.unlock();
    const bool ok = code_row(e, w, &b.target, row);
    g.lock();
    if (!ok) {
        fail_locked(e, w->failed);
        return false;
    }
    b.done = true;
    // One worker at a time hands rows on (the main target has one writer);
    // rows completed meanwhile are picked up by its loop.
    if (e->handing) return true;
    e->handing = true;
    while (e->failed == 0 && e->handed < e->rows) {
        RowBuffer& next = e->buffer[e->handed % e->window];
        if (!next.done || next.row != e->handed) break;
        const uint32_t first = e->handed;
        g.unlock();
        const bool written = hand_on_row(e, first, next.target);
        g.lock();
        if (!written) {
            fail_locked(e, e->main->failed);
            break;
        }
        next.busy = next.done = false;
        ++e->handed;
        e->changed.notify_all();
    }
    e->handing = false;
    return e->failed == 0;
}

}  // namespace
}  // namespace tekoj

extern "C" {

EKO_API EkoParallelEncode* eko_enc_jpeg_parallel_create(const ImageInfo* image_info, const OutputRequest* output,
                                                        const EncodeOptions* options,
                                                        const EncoderSettings* settings, EkoStreamCallback callback,
                                                        void* callback_arg, uint32_t workers) {
    using namespace tekoj;
    if (image_info == nullptr || output == nullptr || workers == 0 || workers > kMaxWorkers ||
        (output->kind == EKO_OUTPUT_STREAM && callback == nullptr) ||
        (output->kind == EKO_OUTPUT_FILE && output->file == nullptr)) {
        refuse(EKO_ERR_ARGUMENT);
        return nullptr;
    }
    EncoderContext* main = create_context(image_info, output, options, settings);
    if (main == nullptr) return nullptr;
    void* place = DORVATEKO_OsMalloc(sizeof(Encode));
    if (place == nullptr) {
        eko_SetError(EKO_ERR_ALLOC);
        discard_context(main);
        return nullptr;
    }
    auto* e = new (place) Encode{};
    e->main = main;
    e->origin = read_origin(main);
    e->rows = main->total_imcu_rows;
    e->workers = workers;
    e->serial = !rows_independent(main);
    if (!prepare(e)) {
        discard_context(main);
        release_encode(e);
        return nullptr;
    }
    // Everything is allocated before the header: a memory block that fails
    // to grow is freed, and from here on the encode reports that at finish.
    if (output->kind == EKO_OUTPUT_STREAM) {
        main->output->callback = callback;
        main->output->callback_arg = callback_arg;
    }
    main->exif_info = image_info->exif_info;
    write_header(main);
    e->failed = main->failed;
    return e;
}

EKO_API uint32_t eko_enc_jpeg_parallel_row_count(const EkoParallelEncode* encode) {
    return encode == nullptr ? 0 : encode->rows;
}

EKO_API uint32_t eko_enc_jpeg_parallel_rows(EkoParallelEncode* encode, uint32_t worker, uint32_t first_row,
                                            uint32_t row_count) {
    using namespace tekoj;
    if (encode == nullptr || worker >= encode->workers || first_row > encode->rows ||
        row_count > encode->rows - first_row)
        return refuse(EKO_ERR_ARGUMENT);
    Encode* e = encode;
    Guard g(e->lock);
    if (e->worker[worker].busy) return refuse(EKO_ERR_STATE);
    e->worker[worker].busy = true;
    bool ok = e->failed == 0;
    for (uint32_t k = 0; ok && k < row_count; ++k)
        ok = e->serial ? serial_row(e, g, first_row + k) : parallel_row(e, g, e->worker[worker].ctx, first_row + k);
    e->worker[worker].busy = false;
    e->changed.notify_all();
    if (!ok) eko_SetError(e->failed);
    return ok ? 1 : 0;
}

EKO_API uint32_t eko_enc_jpeg_parallel_finish(EkoParallelEncode* encode, uint8_t** buffer_out,
                                              uint32_t* length_out) {
    using namespace tekoj;
    if (encode == nullptr) return refuse(EKO_ERR_ARGUMENT);
    Encode* e = encode;
    EncoderContext* main = e->main;
    if (main->output->kind == EKO_OUTPUT_MEMORY && (buffer_out == nullptr || length_out == nullptr))
        return refuse(EKO_ERR_ARGUMENT);
    {
        Guard g(e->lock);
        for (uint32_t i = 0; i < e->workers; ++i)
            if (e->worker[i].busy) return refuse(EKO_ERR_STATE);
        if (e->failed == 0 && e->handed != e->rows) fail_locked(e, EKO_ERR_STATE);
    }
    bool ok = e->failed == 0 && complete_stream(main, true) && main->failed == 0;
    OutputTarget* t = main->output;
    uint8_t* block = nullptr;
    uint32_t length = 0;
    if (t->kind == EKO_OUTPUT_MEMORY) {
        if (ok) {
            block = t->buffer;
            length = t->total;
        } else if (t->buffer != nullptr) {
            DORVATEKO_OsFree(t->buffer);
        }
    }
    if (buffer_out != nullptr) *buffer_out = block;
    if (length_out != nullptr) *length_out = length;
    if (!ok) eko_SetError(e->failed != 0 ? e->failed : main->failed);
    discard_context(main);
    release_encode(e);
    return ok ? 1 : 0;
}

}  // extern "C"
