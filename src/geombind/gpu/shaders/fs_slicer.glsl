void main( )
{
    gl_FragColor = vec4( !gl_FrontFacing );
}
