// The start-up of the settings: their defaults, the environment, the banner, the final check.

#ifndef OBR_MEMPOOL_ENVINIT_HPP
#define OBR_MEMPOOL_ENVINIT_HPP

namespace OBR::MemPool {

// Its construction is the start-up. It throws a text, const char*, if the record sizes of the
// environment cannot work; the text outlives the unwinding.
class EnvInit {
public:
    EnvInit();
};

}  // namespace OBR::MemPool

#endif
