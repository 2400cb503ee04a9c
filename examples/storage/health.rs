// Prints the disks and the flash storage's health from Rust, without crates (TALLYRUN_ROOT, or /).
// health [DISK]: of that disk; else of the device's storage.
use std::ffi::{CStr, CString};
use std::os::raw::{c_char, c_int, c_void};
use std::{env, process, ptr};

// Handles, the constants and functions of storage_c.h that are used here.
type Handle = *mut c_void;
const HAS_FIGURES: u32 = 4;
const INT64: c_int = 1;
const UINT64: c_int = 2;
const DOUBLE: c_int = 3;

#[link(name = "tallystorage")]
extern "C" {
    fn tallystorage_error_text() -> *const c_char;
    fn tallystorage_open(root: *const c_char, device: *mut Handle) -> c_int;
    fn tallystorage_close(device: Handle);
    fn tallystorage_list_disks(device: Handle, disks: *mut Handle) -> c_int;
    fn tallystorage_free_disks(disks: Handle);
    fn tallystorage_disk_count(disks: Handle) -> usize;
    fn tallystorage_disk_name(disks: Handle, index: usize, name: *mut *const c_char) -> c_int;
    fn tallystorage_disk_kind(disks: Handle, index: usize, kind: *mut *const c_char) -> c_int;
    fn tallystorage_disk_flags(disks: Handle, index: usize, flags: *mut u32) -> c_int;
    fn tallystorage_nand_info(device: Handle, disk: *const c_char, values: *mut Handle) -> c_int;
    fn tallystorage_nand_health(device: Handle, disk: *const c_char, values: *mut Handle) -> c_int;
    fn tallystorage_free_values(values: Handle);
    fn tallystorage_value_count(values: Handle) -> usize;
    fn tallystorage_find(values: Handle, name: *const c_char, index: *mut usize) -> c_int;
    fn tallystorage_value_name(values: Handle, index: usize, name: *mut *const c_char) -> c_int;
    fn tallystorage_value_kind(values: Handle, index: usize, kind: *mut c_int) -> c_int;
    fn tallystorage_value_int64(values: Handle, index: usize, value: *mut i64) -> c_int;
    fn tallystorage_value_uint64(values: Handle, index: usize, value: *mut u64) -> c_int;
    fn tallystorage_value_double(values: Handle, index: usize, value: *mut f64) -> c_int;
    fn tallystorage_value_text(values: Handle, index: usize, text: *mut *const c_char) -> c_int;
}

fn owned(text: *const c_char) -> String {
    unsafe { CStr::from_ptr(text) }.to_string_lossy().into_owned()
}

// What a function stores through its last parameter.
fn got<T>(start: T, call: impl FnOnce(*mut T) -> c_int) -> T {
    let mut result = start;
    if call(&mut result) != 0 {
        eprintln!("{}", owned(unsafe { tallystorage_error_text() }));
        process::exit(1);
    }
    result
}

fn text(call: impl FnOnce(*mut *const c_char) -> c_int) -> String {
    owned(got(ptr::null(), call))
}

unsafe fn print_value(values: Handle, i: usize) {
    let name = text(|out| tallystorage_value_name(values, i, out));
    match got(0, |out| tallystorage_value_kind(values, i, out)) {
        INT64 => println!("{} = {}", name, got(0, |out| tallystorage_value_int64(values, i, out))),
        UINT64 => println!("{} = {}", name, got(0, |out| tallystorage_value_uint64(values, i, out))),
        DOUBLE => println!("{} = {}", name, got(0.0, |out| tallystorage_value_double(values, i, out))),
        _ => println!("{} = {}", name, text(|out| tallystorage_value_text(values, i, out))),
    }
}

fn main() {
    let name = env::args().nth(1).map(|disk| CString::new(disk).expect("no zero byte in it"));
    let disk = name.as_ref().map_or(ptr::null(), |name| name.as_ptr());
    let version = CString::new("vellum.NANDInfo.ExportVersion").expect("no zero byte in it");
    unsafe {
        let device = got(ptr::null_mut(), |out| tallystorage_open(ptr::null(), out));
        let disks = got(ptr::null_mut(), |out| tallystorage_list_disks(device, out));
        for i in 0..tallystorage_disk_count(disks) {
            let name = text(|out| tallystorage_disk_name(disks, i, out));
            let kind = text(|out| tallystorage_disk_kind(disks, i, out));
            let flags = got(0, |out| tallystorage_disk_flags(disks, i, out));
            let says = if flags & HAS_FIGURES != 0 { ", says how worn it is" } else { "" };
            println!("disk {}: {}{}", name, kind, says);
        }
        let health = got(ptr::null_mut(), |out| tallystorage_nand_health(device, disk, out));
        for i in 0..tallystorage_value_count(health) {
            print_value(health, i);
        }
        let info = got(ptr::null_mut(), |out| tallystorage_nand_info(device, disk, out));
        let index = got(0, |out| tallystorage_find(info, version.as_ptr(), out));
        print_value(info, index);
        tallystorage_free_values(info);
        tallystorage_free_values(health);
        tallystorage_free_disks(disks);
        tallystorage_close(device);
    }
}
